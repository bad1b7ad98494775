// SPDX-License-Identifier: Apache-2.0
/// An invitation to join a home. The spellings of the keys are not uniform, and are exactly these:
/// they are those of the program that keeps the homes, and not ours to tidy. Data alone.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

/// Both are required once the dictionary is there.
struct VespHearthInvitationRequestedCapabilitiesSchema {
  FIELD(Double, hearthdVersion, "kHearthdVersionKey");
  FIELD(Array<Int64>, homeSupportedFeatures, "kHearthdSupportedFeaturesKey");

  CODING_KEYS(VespHearthInvitationRequestedCapabilitiesSchema);
};

/// Any numbers. A rule of an empty dictionary is a rule.
struct VespHearthInviteeScheduleWeekDayRuleSchema {
  FIELD(Optional<Int64>, startTime, "HRWeekDayScheduleRuleCodingKeyStartTime");
  FIELD(Optional<Int64>, endTime, "HRWeekDayScheduleRuleCodingKeyEndTime");
  FIELD(Optional<Int64>, daysOfTheWeek, "HRWeekDayScheduleRuleCodingKeyDaysOfTheWeek");

  CODING_KEYS(VespHearthInviteeScheduleWeekDayRuleSchema);
};

struct VespHearthInviteeScheduleYearDayRuleSchema {
  FIELD(Optional<Date>, startDate, "HRDStartDateKey");
  FIELD(Optional<Date>, endDate, "HRDEndDateKey");

  CODING_KEYS(VespHearthInviteeScheduleYearDayRuleSchema);
};

/// A list is decoded whole or not at all: one mistyped rule fails the message. A schedule with a
/// rule missing would be another schedule.
struct VespHearthInviteeScheduleSchema {
  FIELD(Optional<Array<VespHearthInviteeScheduleWeekDayRuleSchema>>, weekDayRules,
        "HRWeekDayScheduleRules");
  FIELD(Optional<Array<VespHearthInviteeScheduleYearDayRuleSchema>>, yearDayRules,
        "HRYearDayScheduleRules");

  CODING_KEYS(VespHearthInviteeScheduleSchema);
};

/// All of it is optional, so an empty dictionary is an invitation.
struct VespHearthInvitationSchema {
  FIELD(Optional<String>, homeName, "kHomeName");
  FIELD(Optional<Date>, invitationExpiryDate, "kInvitationExpiryDateKey");
  FIELD(Optional<VespHearthInvitationRequestedCapabilitiesSchema>, requestedCapabilities,
        "kRequestedCapabilitiesKey");
  FIELD(Optional<Bool>, suppressInviteNotification, "HRDHomeSuppressInviteNotificationKey");
  FIELD(Optional<Int64>, inviteePrivilege, "HRHomeInviteePrivilegeCodingKey");
  FIELD(Optional<Bool>, doesHomeHaveCameras, "HRIncomingInvitationHomeHasCamerasCodingKey");
  FIELD(Optional<VespHearthInviteeScheduleSchema>, inviteeSchedule, "HR.RG.Schedule");
  // Texts on the wire. One that is no UUID fails the message.
  FIELD(Optional<UUID>, homeUUID, "kHomeUUID");
  FIELD(Optional<Data>, controllerPublicKey, "kControllerPublicKey");
  FIELD(Optional<String>, controllerPairingName, "kControllerPairingNameKey");
  FIELD(Optional<UUID>, invitationIdentifier, "kInvitationIdentifierKey");
  // Deliberate: its type is checked and it reaches no record.
  FIELD(Optional<String>, invitationShareURL, "HRDHomeInvitationShareURLKey");
  FIELD(Optional<Data>, invitationShareToken, "HRDHomeInvitationShareTokenKey");
  FIELD(Optional<String>, userId, "kUserIDKey");
  FIELD(Optional<Int64>, invitationState, "kInvitationStateKey");
  FIELD(Optional<Int64>, presenceAuthorizationStatus, "kUserPresenceAuthorizationStatusKey");
  FIELD(Optional<Data>, issuerPublicKeyExternalRepresentation,
        "HRDIssuerPublicKeyExternalRepresentationKey");

  CODING_KEYS(VespHearthInvitationSchema);
};

}  // namespace VespKeelgateService

#include <keelgate/describe_end.h>
