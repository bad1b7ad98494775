// SPDX-License-Identifier: Apache-2.0
/// The record of an invitation: an envelope around one of five kinds.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>
#include <variant>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// A cloud sharing token: opaque octets, never empty.
struct SkyvaultSharingToken {
  FIELD(Data, tokenData);

  LABELS(SkyvaultSharingToken);
};

/// The smallest kind; all of it may be absent.
struct VespSampleInvitation {
  FIELD(Optional<String>, title);
  FIELD(Optional<Date>, date);
  FIELD(Optional<String>, reason);

  LABELS(VespSampleInvitation);
};

/// The least version of the home's hub, and the features that it must have.
struct VespHearthInvitationRequestedCapabilities {
  FIELD(Double, hearthdVersion);
  FIELD(Array<Int>, homeSupportedFeatures);

  LABELS(VespHearthInvitationRequestedCapabilities);
};

/// The times are as the sender counts them; neither they nor the day mask are checked.
struct VespHearthInviteeScheduleWeekDayRule {
  FIELD(Optional<Int>, startTime);
  FIELD(Optional<Int>, endTime);
  FIELD(Optional<Int>, daysOfTheWeek);

  LABELS(VespHearthInviteeScheduleWeekDayRule);
};

/// Days on which the invited person may come in. The end may lie before the start.
struct VespHearthInviteeScheduleYearDayRule {
  FIELD(Optional<Date>, startDate);
  FIELD(Optional<Date>, endDate);

  LABELS(VespHearthInviteeScheduleYearDayRule);
};

/// When the invited person may come in. Both lists are always present.
struct VespHearthInviteeSchedule {
  FIELD(Optional<Array<VespHearthInviteeScheduleWeekDayRule>>, weekDayRules);
  FIELD(Optional<Array<VespHearthInviteeScheduleYearDayRule>>, yearDayRules);

  LABELS(VespHearthInviteeSchedule);
};

/// An invitation to join a home. Deliberate: it has no share URL.
struct VespHearthInvitation {
  /// Keeps the octets of a sharing token; throws Breach when there are none.
  static SkyvaultSharingToken decodeSkyvaultToken(Data tokenData);

  FIELD(Optional<String>, homeName);
  FIELD(Optional<Date>, inviteExpiryDate);
  /// What the home's hub must be able to do.
  FIELD(Optional<VespHearthInvitationRequestedCapabilities>, requestedCapabilities);
  /// What the invited person may do, and when.
  FIELD(Optional<Bool>, homeSuppressInviteNotification);
  FIELD(Optional<Int>, inviteePrivilege);
  FIELD(Optional<Bool>, doesHomeHaveCameras);
  FIELD(Optional<VespHearthInviteeSchedule>, inviteeSchedule);
  /// The home, and the hub that speaks for it.
  FIELD(Optional<UUID>, homeUUID);
  FIELD(Optional<Data>, controllerPublicKey);
  FIELD(Optional<String>, controllerPairingName);
  /// The invitation itself.
  FIELD(Optional<UUID>, invitationIdentifier);
  FIELD(Optional<SkyvaultSharingToken>, invitationShareToken);
  FIELD(Optional<String>, userId);
  FIELD(Optional<Int>, invitationState);
  FIELD(Optional<Int>, presenceAuthorizationStatus);
  /// Of whoever issued the invitation. Nothing vouches for it yet.
  FIELD(Optional<Data>, issuerPublicKeyExternalRepresentation);

  LABELS(VespHearthInvitation);
};

/// An invitation to share a group of stored credentials.
struct VespCofferSharingInvitation {
  /// Keeps the octets of a sharing token; throws Breach when there are none, or no share URL.
  static SkyvaultSharingToken decodeSkyvaultToken(Data tokenData, const String& shareURL);

  FIELD(String, groupID);
  FIELD(SkyvaultSharingToken, invitationToken);
  FIELD(String, inviteeHandle);
  FIELD(Optional<Date>, sentTime);
  FIELD(Optional<String>, displayName);

  LABELS(VespCofferSharingInvitation);
};

/// An invitation to share measurements.
struct VespVitalsInvitation {
  /// A serialised message that nobody has looked into.
  FIELD(Data, untrustedData);

  LABELS(VespVitalsInvitation);
};

/// An invitation to share activity.
struct VespStrideSharingInvitation {
  FIELD(Int, item);
  /// A serialised message that nobody has looked into.
  FIELD(Data, untrustedData);

  LABELS(VespStrideSharingInvitation);
};

/// The kind of an invitation, with its record.
struct VespDictionaryContext
    : std::variant<VespSampleInvitation, VespHearthInvitation, VespCofferSharingInvitation,
                   VespVitalsInvitation, VespStrideSharingInvitation> {
  CASES(VespDictionaryContext, vespSampleInvitation, vespHearthInvitation,
        vespCofferSharingInvitation, vespVitalsInvitation, vespStrideSharingInvitation);
};

/// How the context is written down; there is one way.
struct VespInvitationContextType : std::variant<VespDictionaryContext> {
  CASES(VespInvitationContextType, dictionary);
};

/// Which kind the invitation is, and its record.
struct VespInvitationContext {
  /// The schema string that named the kind.
  FIELD(String, schema);
  FIELD(Int, contextType);
  FIELD(VespInvitationContextType, context);

  LABELS(VespInvitationContext);
};

/// The envelope. Its values are those of the message, unchecked.
struct VespInvitation {
  FIELD(VespInvitationContext, context);
  FIELD(Int, state);
  /// As the sender counts it; not compared with any clock.
  FIELD(Optional<Double>, expiration);
  FIELD(String, identifier);

  LABELS(VespInvitation);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
