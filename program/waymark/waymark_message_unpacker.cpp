// SPDX-License-Identifier: Apache-2.0
#include "program/waymark/waymark_message_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/schema/property_list_decoder.h"
#include "program/waymark/waymark_group_fold.h"

namespace VespKeelgateService {

using namespace Keelgate;

VespClientMessageResult WaymarkMessageUnpacker::unpack(Bytes from, const Context& with) const {
  return dispatch(Commands(), with, [&]<class Row>(Row) {
    auto checkIn = PropertyListDecoder().decode<typename Row::Schema, FoldedCheckIn>(from);
    auto& [message, codes] = checkIn;
    // Deliberate: the one place where an unknown code is not an error. It becomes its enumeration's
    // default.
    message.messageType = defaulting<WMMessageType>(codes.messageType);
    message.sessionType = defaulting<WMsessionType>(codes.sessionType);
    message.sessionDestinationType =
        defaulting<WMSessionDestinationType>(codes.sessionDestinationType);
    message.lowPowerModeWarningState =
        defaulting<WMDeviceConfigurationLowPowerModeWarningState>(codes.lowPowerModeWarningState);
    message.referenceFrame = defaulting<GLClientLocationReferenceFrame>(codes.referenceFrame);
    message.triggerType = defaulting<WMTriggerCategory>(codes.triggerType);
    constructInPlace(*message.groupFields);
    constructInPlace(message);
    return VespClientMessageResult{.result = std::move(message)};
  });
}

}  // namespace VespKeelgateService
