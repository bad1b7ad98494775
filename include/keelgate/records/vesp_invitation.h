// SPDX-License-Identifier: Apache-2.0
/// The record of an invitation: an envelope around one of five kinds. Values that own all that they
/// hold; separate ones may be used from separate threads.
///
/// Anyone can send an invitation: that it was decoded says nothing about who sent it.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

namespace Keelgate {

/// A cloud sharing token: opaque octets, never empty. Not parsed here: only the cloud can tell
/// whether it opens anything.
struct SkyvaultSharingToken {
  KEELGATE_RECORD(SkyvaultSharingToken,
      (Data, tokenData));
};

/// The smallest kind; every field may be absent.
struct VespSampleInvitation {
  KEELGATE_RECORD(VespSampleInvitation,
      (Optional<String>, title),
      (Optional<Date>, date),
      (Optional<String>, reason));
};

/// The minimum version of the home's hub, and the features that it must have, as codes. Both are
/// present whenever the message has the dictionary.
struct VespHearthInvitationRequestedCapabilities {
  KEELGATE_RECORD(VespHearthInvitationRequestedCapabilities,
      (Double, hearthdVersion),
      (Array<Int>, homeSupportedFeatures));
};

/// The times are as the sender counts them; neither they nor the day mask are checked. An empty
/// rule is kept as a rule.
struct VespHearthInviteeScheduleWeekDayRule {
  KEELGATE_RECORD(VespHearthInviteeScheduleWeekDayRule,
      (Optional<Int>, startTime),
      (Optional<Int>, endTime),
      (Optional<Int>, daysOfTheWeek));
};

/// Days on which the invited person may come in. The end may lie before the start.
struct VespHearthInviteeScheduleYearDayRule {
  KEELGATE_RECORD(VespHearthInviteeScheduleYearDayRule,
      (Optional<Date>, startDate),
      (Optional<Date>, endDate));
};

/// When the invited person may come in. Both lists are always present, and empty where the message
/// has none; no schedule at all is an absent VespHearthInviteeSchedule.
struct VespHearthInviteeSchedule {
  KEELGATE_RECORD(VespHearthInviteeSchedule,
      (Optional<Array<VespHearthInviteeScheduleWeekDayRule>>, weekDayRules),
      (Optional<Array<VespHearthInviteeScheduleYearDayRule>>, yearDayRules));
};

/// An invitation to join a home. Every field may be absent. Deliberate: there is no share URL here;
/// that of the message is only checked for its type.
struct VespHearthInvitation {
  /// Keeps the octets of a sharing token; throws Breach when there are none.
  static SkyvaultSharingToken decodeSkyvaultToken(Data tokenData);

  KEELGATE_RECORD(VespHearthInvitation,
      (Optional<String>, homeName),
      (Optional<Date>, inviteExpiryDate),
      /// What the home's hub must be able to do.
      (Optional<VespHearthInvitationRequestedCapabilities>, requestedCapabilities),
      /// What the invited person may do, and when.
      (Optional<Bool>, homeSuppressInviteNotification),
      (Optional<Int>, inviteePrivilege),
      (Optional<Bool>, doesHomeHaveCameras),
      (Optional<VespHearthInviteeSchedule>, inviteeSchedule),
      /// The home, and the hub that speaks for it.
      (Optional<UUID>, homeUUID),
      (Optional<Data>, controllerPublicKey),
      (Optional<String>, controllerPairingName),
      /// The invitation itself.
      (Optional<UUID>, invitationIdentifier),
      (Optional<SkyvaultSharingToken>, invitationShareToken),
      (Optional<String>, userId),
      (Optional<Int>, invitationState),
      (Optional<Int>, presenceAuthorizationStatus),
      /// The key of whoever issued the invitation. Nothing vouches for it yet.
      (Optional<Data>, issuerPublicKeyExternalRepresentation));
};

/// An invitation to share a group of stored credentials. Its share URL is needed to decode the
/// token and is not kept.
struct VespCofferSharingInvitation {
  /// Keeps the octets of a sharing token; throws Breach when there are none, or no share URL.
  static SkyvaultSharingToken decodeSkyvaultToken(Data tokenData, const String& shareURL);

  KEELGATE_RECORD(VespCofferSharingInvitation,
      (String, groupID),
      (SkyvaultSharingToken, invitationToken),
      (String, inviteeHandle),
      (Optional<Date>, sentTime),
      (Optional<String>, displayName));
};

/// An invitation to share measurements.
struct VespVitalsInvitation {
  KEELGATE_RECORD(VespVitalsInvitation,
      /// A serialised message, not parsed here.
      (Data, untrustedData));
};

/// An invitation to share activity.
struct VespStrideSharingInvitation {
  KEELGATE_RECORD(VespStrideSharingInvitation,
      (Int, item),
      /// A serialised message, not parsed here.
      (Data, untrustedData));
};

/// The kind of an invitation, with its record. The position of an alternative travels between
/// service and client, which are of one build.
KEELGATE_CASES(VespDictionaryContext,
    (VespSampleInvitation, vespSampleInvitation),
    (VespHearthInvitation, vespHearthInvitation),
    (VespCofferSharingInvitation, vespCofferSharingInvitation),
    (VespVitalsInvitation, vespVitalsInvitation),
    (VespStrideSharingInvitation, vespStrideSharingInvitation));

/// How the context is encoded; there is one way.
KEELGATE_CASES(VespInvitationContextType,
    (VespDictionaryContext, dictionary));

/// Which kind the invitation is, and its record.
struct VespInvitationContext {
  KEELGATE_RECORD(VespInvitationContext,
      /// The schema string that named the kind.
      (String, schema),
      /// Always 1, the only encoding: any other number is rejected.
      (Int, contextType),
      (VespInvitationContextType, context));
};

/// The envelope. Its values are those of the message, unchecked.
struct VespInvitation {
  KEELGATE_RECORD(VespInvitation,
      (VespInvitationContext, context),
      /// The sender's code. Any integer.
      (Int, state),
      /// As the sender counts it; not compared with any clock.
      (Optional<Double>, expiration),
      /// Any text, an empty one too.
      (String, identifier));
};

}  // namespace Keelgate
