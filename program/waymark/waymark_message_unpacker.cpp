// SPDX-License-Identifier: Apache-2.0
#include "program/waymark/waymark_message_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/schema/property_list_decoder.h"
#include "program/waymark/waymark_group_fold.h"

namespace VespKeelgateService {

using namespace Keelgate;

namespace {

/// Deliberate: the one place where an unknown code is not an error. It becomes its enumeration's
/// default.
WaymarkMessage convertMessage(WaymarkSchema&& schema, Array<WaymarkGroupFields>&& groups) {
  return construct<WaymarkMessage>({
      .messageType = defaulting<WMMessageType>(schema.messageType),
      .interfaceVersion = schema.interfaceVersion,
      .sendDate = schema.sendDate,
      .messageID = std::move(schema.messageID),
      .sessionID = std::move(schema.sessionID),
      .summaryText = std::move(schema.summaryText),
      .receiverHandle = std::move(schema.receiverHandle),
      .sharingInvitationData = std::move(schema.sharingInvitationData),
      .shareURL = std::move(schema.shareURL),
      .participantID = std::move(schema.participantID),
      .sessionType = defaulting<WMsessionType>(schema.sessionType),
      .estimatedEndTime = schema.estimatedEndTime,
      .coarseEstimatedEndTime = schema.coarseEstimatedEndTime,
      .sessionDestinationType = defaulting<WMSessionDestinationType>(schema.sessionDestinationType),
      .sessionDestinationMapItem = std::move(schema.sessionDestinationMapItem),
      .lowPowerModeWarningState = defaulting<WMDeviceConfigurationLowPowerModeWarningState>(
          schema.lowPowerModeWarningState),
      .triggerTime = schema.triggerTime,
      .latitude = schema.latitude,
      .longitude = schema.longitude,
      .hunc = schema.hunc,
      .altitude = schema.altitude,
      .vunc = schema.vunc,
      .timeOfLocation = schema.timeOfLocation,
      .referenceFrame = defaulting<GLClientLocationReferenceFrame>(schema.referenceFrame),
      .speed = schema.speed,
      .triggerType = defaulting<WMTriggerCategory>(schema.triggerType),
      .safetyCacheKey = std::move(schema.safetyCacheKey),
      .safetyCacheToken = std::move(schema.safetyCacheToken),
      .isSOSTrigger = schema.isSOSTrigger,
      .groupFields = std::move(groups),
  });
}

}  // namespace

VespClientMessageResult WaymarkMessageUnpacker::unpack(Bytes from, const Context& with) const {
  return dispatch(Commands(), with, [&]<class Row>(Row) {
    auto checkIn = PropertyListDecoder().decode<typename Row::Schema, FoldedCheckIn>(from);
    constructInPlace(checkIn.groups);
    return VespClientMessageResult{
        .result = convertMessage(std::move(checkIn.fields), std::move(checkIn.groups))};
  });
}

}  // namespace VespKeelgateService
