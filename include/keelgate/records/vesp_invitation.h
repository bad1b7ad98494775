// SPDX-License-Identifier: Apache-2.0
/// The record of an invitation: an envelope around one of five kinds. Values that own all that they
/// hold; separate ones may be used from separate threads.
///
/// Anybody can send an invitation. That one was decoded says nothing of who sent it.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>
#include <variant>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// A cloud sharing token: opaque octets, never empty. Not parsed here: that it opens anything is
/// for the cloud to say.
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

/// The least version of the home's hub, and the features that it must have. Both are always there
/// once the message has the dictionary; the features are codes.
struct VespHearthInvitationRequestedCapabilities {
  FIELD(Double, hearthdVersion);
  FIELD(Array<Int>, homeSupportedFeatures);

  LABELS(VespHearthInvitationRequestedCapabilities);
};

/// The times are as the sender counts them; neither they nor the day mask are checked. A rule with
/// nothing in it is kept as one.
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

/// When the invited person may come in. Both lists are always present, and empty where the message
/// has none; no schedule at all is an absent VespHearthInviteeSchedule.
struct VespHearthInviteeSchedule {
  FIELD(Optional<Array<VespHearthInviteeScheduleWeekDayRule>>, weekDayRules);
  FIELD(Optional<Array<VespHearthInviteeScheduleYearDayRule>>, yearDayRules);

  LABELS(VespHearthInviteeSchedule);
};

/// An invitation to join a home. Every field may be absent. Deliberate: it has no share URL: the
/// message's has its type checked and goes no further.
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

/// An invitation to share a group of stored credentials. Its share URL is needed to decode the
/// token and is not kept.
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

/// The kind of an invitation, with its record. The position of an alternative travels between
/// service and client, which are of one build.
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
  /// Always 1, the number of the one way: any other is refused.
  FIELD(Int, contextType);
  FIELD(VespInvitationContextType, context);

  LABELS(VespInvitationContext);
};

/// The envelope. Its values are those of the message, unchecked.
struct VespInvitation {
  FIELD(VespInvitationContext, context);
  /// The sender's code. Any integer.
  FIELD(Int, state);
  /// As the sender counts it; not compared with any clock.
  FIELD(Optional<Double>, expiration);
  /// Any text, an empty one too.
  FIELD(String, identifier);

  LABELS(VespInvitation);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
