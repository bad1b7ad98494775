// SPDX-License-Identifier: Apache-2.0
/// An invitation to join a home. The spellings of the keys are not uniform, and are exactly these:
/// they are those of the program that keeps the homes, and not ours to tidy. Data alone.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

namespace VespKeelgateService {

/// Both are required once the dictionary is there.
struct VespHearthInvitationRequestedCapabilitiesSchema {
  KEELGATE_SCHEMA(VespHearthInvitationRequestedCapabilitiesSchema,
      (Double, hearthdVersion, "kHearthdVersionKey"),
      (Array<Int64>, homeSupportedFeatures, "kHearthdSupportedFeaturesKey"));
};

/// Any numbers. A rule of an empty dictionary is a rule.
struct VespHearthInviteeScheduleWeekDayRuleSchema {
  KEELGATE_SCHEMA(VespHearthInviteeScheduleWeekDayRuleSchema,
      (Optional<Int64>, startTime, "HRWeekDayScheduleRuleCodingKeyStartTime"),
      (Optional<Int64>, endTime, "HRWeekDayScheduleRuleCodingKeyEndTime"),
      (Optional<Int64>, daysOfTheWeek, "HRWeekDayScheduleRuleCodingKeyDaysOfTheWeek"));
};

struct VespHearthInviteeScheduleYearDayRuleSchema {
  KEELGATE_SCHEMA(VespHearthInviteeScheduleYearDayRuleSchema,
      (Optional<Date>, startDate, "HRDStartDateKey"),
      (Optional<Date>, endDate, "HRDEndDateKey"));
};

/// A list is decoded whole or not at all: one mistyped rule fails the message. A schedule with a
/// rule missing would be another schedule.
struct VespHearthInviteeScheduleSchema {
  KEELGATE_SCHEMA(VespHearthInviteeScheduleSchema,
      (Optional<Array<VespHearthInviteeScheduleWeekDayRuleSchema>>, weekDayRules,
       "HRWeekDayScheduleRules"),
      (Optional<Array<VespHearthInviteeScheduleYearDayRuleSchema>>, yearDayRules,
       "HRYearDayScheduleRules"));
};

/// All of it is optional, so an empty dictionary is an invitation.
struct VespHearthInvitationSchema {
  KEELGATE_SCHEMA(VespHearthInvitationSchema,
      (Optional<String>, homeName, "kHomeName"),
      (Optional<Date>, invitationExpiryDate, "kInvitationExpiryDateKey"),
      (Optional<VespHearthInvitationRequestedCapabilitiesSchema>, requestedCapabilities,
       "kRequestedCapabilitiesKey"),
      (Optional<Bool>, suppressInviteNotification, "HRDHomeSuppressInviteNotificationKey"),
      (Optional<Int64>, inviteePrivilege, "HRHomeInviteePrivilegeCodingKey"),
      (Optional<Bool>, doesHomeHaveCameras, "HRIncomingInvitationHomeHasCamerasCodingKey"),
      (Optional<VespHearthInviteeScheduleSchema>, inviteeSchedule, "HR.RG.Schedule"),
      // Texts on the wire. One that is not a UUID fails the message.
      (Optional<UUID>, homeUUID, "kHomeUUID"),
      (Optional<Data>, controllerPublicKey, "kControllerPublicKey"),
      (Optional<String>, controllerPairingName, "kControllerPairingNameKey"),
      (Optional<UUID>, invitationIdentifier, "kInvitationIdentifierKey"),
      // Deliberate: its type is checked and it reaches no record.
      (Optional<String>, invitationShareURL, "HRDHomeInvitationShareURLKey"),
      (Optional<Data>, invitationShareToken, "HRDHomeInvitationShareTokenKey"),
      (Optional<String>, userId, "kUserIDKey"),
      (Optional<Int64>, invitationState, "kInvitationStateKey"),
      (Optional<Int64>, presenceAuthorizationStatus, "kUserPresenceAuthorizationStatusKey"),
      (Optional<Data>, issuerPublicKeyExternalRepresentation,
       "HRDIssuerPublicKeyExternalRepresentationKey"));
};

}  // namespace VespKeelgateService
