// SPDX-License-Identifier: Apache-2.0
/// The kind is decoded, and copied field by field, named where schema and record differ. Ranges and
/// the order of dates are the framework's, and not checked here.
#include "program/invitation/vesp_invitation_unpacker.h"

#include "framework/contracts/construct.h"
#include "framework/contracts/unpacker.h"
#include "program/schema/property_list_decoder.h"

#include <keelgate/errors.h>

namespace VespKeelgateService {

using namespace Keelgate;

namespace {

using CapabilitiesSchema = VespHearthInvitationRequestedCapabilitiesSchema;
using WeekDayRuleSchema = VespHearthInviteeScheduleWeekDayRuleSchema;
using YearDayRuleSchema = VespHearthInviteeScheduleYearDayRuleSchema;

VespHearthInvitationRequestedCapabilities convertCapabilities(const CapabilitiesSchema& schema) {
  return construct<VespHearthInvitationRequestedCapabilities>({
      .hearthdVersion = schema.hearthdVersion,
      .homeSupportedFeatures =
          Array<Int>(schema.homeSupportedFeatures.begin(), schema.homeSupportedFeatures.end()),
  });
}

VespHearthInviteeScheduleWeekDayRule convertRule(const WeekDayRuleSchema& schema) {
  return construct<VespHearthInviteeScheduleWeekDayRule>({
      .startTime = schema.startTime,
      .endTime = schema.endTime,
      .daysOfTheWeek = schema.daysOfTheWeek,
  });
}

VespHearthInviteeScheduleYearDayRule convertRule(const YearDayRuleSchema& schema) {
  return construct<VespHearthInviteeScheduleYearDayRule>({
      .startDate = schema.startDate,
      .endDate = schema.endDate,
  });
}

/// An absent list of rules gives an empty one.
template <class R, class S>
Array<R> convertRules(const Optional<Array<S>>& schemas) {
  // Present and empty: a schedule without rules is not the same as no schedule.
  Array<R> rules;
  if (!schemas) return rules;
  rules.reserve(schemas->size());
  for (const S& schema : *schemas) rules.push_back(convertRule(schema));
  return rules;
}

VespHearthInviteeSchedule convertSchedule(const VespHearthInviteeScheduleSchema& schema) {
  auto weekDayRules = convertRules<VespHearthInviteeScheduleWeekDayRule>(schema.weekDayRules);
  auto yearDayRules = convertRules<VespHearthInviteeScheduleYearDayRule>(schema.yearDayRules);
  return construct<VespHearthInviteeSchedule>({
      .weekDayRules = std::move(weekDayRules),
      .yearDayRules = std::move(yearDayRules),
  });
}

VespSampleInvitation convertKind(VespSampleInvitationSchema&& schema) {
  return construct<VespSampleInvitation>({
      .title = std::move(schema.title),
      .date = schema.date,
      .reason = std::move(schema.reason),
  });
}

/// Deliberate: its share URL goes nowhere, and that of the credentials' kind only to the decoder of
/// the token.
VespHearthInvitation convertKind(VespHearthInvitationSchema&& schema) {
  // The order decides which error a message with several faults gives.
  Optional<VespHearthInvitationRequestedCapabilities> capabilities;
  if (schema.requestedCapabilities) {
    capabilities = convertCapabilities(*schema.requestedCapabilities);
  }
  Optional<SkyvaultSharingToken> token;
  if (schema.invitationShareToken) {
    // Deliberate: from its octets alone. The share URL is not used.
    token = VespHearthInvitation::decodeSkyvaultToken(*std::move(schema.invitationShareToken));
  }
  Optional<VespHearthInviteeSchedule> schedule;
  if (schema.inviteeSchedule) schedule = convertSchedule(*schema.inviteeSchedule);

  return construct<VespHearthInvitation>({
      .homeName = std::move(schema.homeName),
      .inviteExpiryDate = schema.invitationExpiryDate,
      .requestedCapabilities = std::move(capabilities),
      .homeSuppressInviteNotification = schema.suppressInviteNotification,
      .inviteePrivilege = schema.inviteePrivilege,
      .doesHomeHaveCameras = schema.doesHomeHaveCameras,
      .inviteeSchedule = std::move(schedule),
      .homeUUID = schema.homeUUID,
      .controllerPublicKey = std::move(schema.controllerPublicKey),
      .controllerPairingName = std::move(schema.controllerPairingName),
      .invitationIdentifier = schema.invitationIdentifier,
      .invitationShareToken = std::move(token),
      .userId = std::move(schema.userId),
      .invitationState = schema.invitationState,
      .presenceAuthorizationStatus = schema.presenceAuthorizationStatus,
      .issuerPublicKeyExternalRepresentation =
          std::move(schema.issuerPublicKeyExternalRepresentation),
  });
}

VespCofferSharingInvitation convertKind(VespCofferSharingInvitationSchema&& schema) {
  // First, since its decoder may throw, and with the URL, which only it needs.
  SkyvaultSharingToken token = VespCofferSharingInvitation::decodeSkyvaultToken(
      std::move(schema.invitationToken), schema.shareURL);
  return construct<VespCofferSharingInvitation>({
      .groupID = std::move(schema.groupID),
      .invitationToken = std::move(token),
      .inviteeHandle = std::move(schema.inviteeHandle),
      .sentTime = schema.sentTime,
      .displayName = std::move(schema.displayName),
  });
}

/// The octets of these two are handed on unread: what is in them is another program's format.
VespVitalsInvitation convertKind(VespVitalsInvitationSchema&& schema) {
  return construct<VespVitalsInvitation>({.untrustedData = std::move(schema.protobufData)});
}

VespStrideSharingInvitation convertKind(VespStrideSharingInvitationSchema&& schema) {
  return construct<VespStrideSharingInvitation>({
      .item = schema.protobufItem,
      .untrustedData = std::move(schema.protobufPayload),
  });
}

using Keys = VespInvitationContextSchema::CodingKeys;

template <VespInvitationClientPayload Payload>
VespDictionaryContextData decodeKind(const KeyedContainer& container) {
  return VespDictionaryContextClientSchema(
      container.decode<Payload>(Keys::keyOf(&VespInvitationContextSchema::contextData)));
}

/// A row of the table that chooses the kind.
struct Kind {
  std::string_view schema;
  VespDictionaryContextData (*decode)(const KeyedContainer& container);
};

/// Compared exactly: no prefix, no other case.
constexpr Kind kinds[] = {
    {"com.tessen.Vesp.schema.invitation", decodeKind<VespSampleInvitationSchema>},
    {"ht-invite-v1", decodeKind<VespHearthInvitationSchema>},
    {"com.tessen.coffersharingmessagingd", decodeKind<VespCofferSharingInvitationSchema>},
    // Deliberate: the one kind without a name of its own.
    {"1", decodeKind<VespVitalsInvitationSchema>},
    {"stride-sharing-invite", decodeKind<VespStrideSharingInvitationSchema>},
};

VespDictionaryContextData decodeContextData(const String& schema, const KeyedContainer& container) {
  for (const Kind& kind : kinds) {
    if (kind.schema == schema) return kind.decode(container);
  }
  // Thrown before the data are looked at: whatever they are, there is no kind to read them as.
  throw Breach("com.tessen.Keelgate.VespKeelgateService",
               "Unknown invitation schema: (" + schema + ")");
}

}  // namespace

VespInvitationContextSchema VespInvitationContextSchema::decode(const KeyedContainer& container) {
  // The order decides which error a message with several faults gives.
  auto schema = container.decode(&VespInvitationContextSchema::schema);
  const auto contextType = container.decode(&VespInvitationContextSchema::contextType);
  auto contextData = decodeContextData(schema, container);
  return {.schema = std::move(schema),
          .contextType = contextType,
          .contextData = std::move(contextData)};
}

VespInvitation VespInvitationUnpacker::unpack(Bytes from) const {
  auto schema = PropertyListDecoder().decode<VespInvitationSchema>(from);
  auto& client = std::get<VespDictionaryContextClientSchema>(schema.context.contextData);
  VespDictionaryContext context = std::visit(
      [](auto& kind) -> VespDictionaryContext { return convertKind(std::move(kind)); }, client);

  return construct<VespInvitation>({
      .context = construct<VespInvitationContext>({
          .schema = std::move(schema.context.schema),
          // The only case there is: any other number was refused when it was decoded.
          .contextType = static_cast<Int>(VespInvitationContextType::dictionary),
          .context = std::move(context),
      }),
      .state = schema.state,
      .expiration = schema.expiration,
      .identifier = std::move(schema.identifier),
  });
}

}  // namespace VespKeelgateService
