// SPDX-License-Identifier: Apache-2.0
/// Copies field by field, named where schema and record differ. Nothing is checked here: ranges and
/// the order of dates are the framework's.
#include "program/invitation/invitation_conversions.h"

#include "framework/contracts/construct.h"

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

}  // namespace

VespSampleInvitation convertKind(VespSampleInvitationSchema&& schema) {
  return construct<VespSampleInvitation>({
      .title = std::move(schema.title),
      .date = schema.date,
      .reason = std::move(schema.reason),
  });
}

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

VespVitalsInvitation convertKind(VespVitalsInvitationSchema&& schema) {
  return construct<VespVitalsInvitation>({.untrustedData = std::move(schema.protobufData)});
}

VespStrideSharingInvitation convertKind(VespStrideSharingInvitationSchema&& schema) {
  return construct<VespStrideSharingInvitation>({
      .item = schema.protobufItem,
      .untrustedData = std::move(schema.protobufPayload),
  });
}

}  // namespace VespKeelgateService
