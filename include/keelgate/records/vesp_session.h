// SPDX-License-Identifier: Apache-2.0
/// The records of the call services: an invitation to a session, its answers and follow-ups. Values
/// that own all that they hold; separate ones may be used from separate threads.
///
/// Each names a session and a participant, as strings that the sender chose. Nothing here knows
/// which sessions exist: an answer may arrive for a call that never was. Unlike in a check-in, a
/// number that an enumeration here does not know fails the message.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

namespace Keelgate {

/// A call is offered. The switches are a stranger's wishes. The host decides on them, above all on
/// those that reduce protection.
struct VespSessionInvitation {
  /// How the media of the call travel.
  KEELGATE_NESTED_ENUMERATION(TransportType, UInt,
      (peerToPeer, 0),
      (relay, 1),
      (multiwayRelay, 2));

  KEELGATE_RECORD(VespSessionInvitation,
      (TransportType, transportType),
      (UInt, version),
      /// Hints and switches for setting up the connection.
      (Optional<UInt>, connectionCountHint),
      (Optional<Bool>, disableEncryption),
      (Optional<Bool>, singleChannelDirectMode),
      (Optional<Bool>, useStunMessageIntegrity),
      (Optional<Bool>, useSecureHLControlMessage),
      /// The offer itself; opaque here.
      (Optional<Data>, blob),
      (Optional<Bool>, messageIsRealTime),
      /// The caller's key. Nothing vouches for it yet.
      (Optional<Data>, unauthenticatedPublicKey),
      (Optional<Bool>, assumeRemoteDeviceEncryption),
      /// Opaque to everyone but the two ends.
      (Optional<Data>, sessionMessageContext),
      (Optional<Bool>, usePhoneTetherLocalMessage),
      /// Who calls, and in which session, as they say.
      (String, participantID),
      (Bool, declineOnNetworkError),
      (String, sessionID),
      (Optional<Bool>, needsToWaitForPreConnectionData),
      (Optional<Bool>, useCloudPairedControlChannel));
};

/// The call is accepted. What describes the sender is called `remote` here, from the caller's point
/// of view.
struct VespSessionAccept {
  KEELGATE_RECORD(VespSessionAccept,
      (UInt, version),
      /// The answer itself; opaque here.
      (Optional<Data>, blob),
      (String, sessionID),
      (String, participantID),
      (Optional<Data>, sessionMessageContext),
      (Optional<Bool>, useCloudPairedControlChannel),
      (Optional<Bool>, useStunMessageIntegrity),
      (Optional<Bool>, useSecureHLControlMessage),
      (Optional<Data>, unauthenticatedPublicKey),
      (Optional<Bool>, remoteUsePhoneTetherLocalMessage),
      /// What the other side's media are secured with, and where its streams begin.
      (Optional<Data>, remoteKeyMaterialData),
      /// Deliberate: signed, as on the wire.
      (Optional<Int>, remoteSSRC),
      (Optional<Int>, remoteSecStart));
};

/// The call is declined. Deliberate: "declined elsewhere" gives this record too, and which of the
/// two commands it was is not kept.
struct VespSessionDecline {
  KEELGATE_RECORD(VespSessionDecline,
      (UInt, version),
      (String, sessionID),
      (String, participantID),
      (Optional<Data>, sessionMessageContext));
};

/// The caller withdraws the offer, or a participant leaves.
struct VespSessionCancel {
  /// Why the other side says that it ended.
  KEELGATE_NESTED_ENUMERATION(VespSessionEndedReason, UInt,
      (unknown, 0),
      (localHangUp, 1),
      (remoteHangUp, 2),
      (noAnswer, 3),
      (answeredElsewhere, 4),
      (declinedElsewhere, 5),
      (busy, 6),
      (networkFailure, 7),
      (mediaFailure, 8));

  KEELGATE_RECORD(VespSessionCancel,
      (UInt, version),
      (String, sessionID),
      (String, participantID),
      /// Absent if the sender gave none.
      (Optional<VespSessionEndedReason>, remoteEndReason),
      (Optional<Data>, sessionMessageContext));
};

/// A running session is to be set up again.
struct VespSessionReinitiate {
  /// There is no default: repeating the wrong step would be worse than doing nothing.
  KEELGATE_NESTED_ENUMERATION(VespSessionReinitiateSubcommand, UInt,
      (restartConnection, 0),
      (renegotiateMedia, 1),
      (switchTransport, 2),
      (rekey, 3));

  KEELGATE_RECORD(VespSessionReinitiate,
      (UInt, version),
      (String, sessionID),
      (String, participantID),
      /// What is to be repeated.
      (VespSessionReinitiateSubcommand, sessionReinitiateSubcommand));
};

}  // namespace Keelgate
