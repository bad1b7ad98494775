// SPDX-License-Identifier: Apache-2.0
/// The records of the call services: an invitation to a session, its answers and follow-ups. Values
/// that own all that they hold; separate ones may be used from separate threads.
///
/// Each names a session and a participant, as texts that the sender chose. Nothing here knows which
/// sessions exist: an answer may come for a call that never was. Unlike a check-in's codes, an
/// unknown number of any enumeration here fails the message.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// A call is offered. The switches are wishes of a stranger. The host decides, above all on those
/// that would take protection away.
struct VespSessionInvitation {
  /// How the media of the call travel.
  NESTED_ENUMERATION(TransportType, UInt, peerToPeer = 0, relay = 1, multiwayRelay = 2);

  FIELD(TransportType, transportType);
  FIELD(UInt, version);
  /// Hints and switches for setting up the connection.
  FIELD(Optional<UInt>, connectionCountHint);
  FIELD(Optional<Bool>, disableEncryption);
  FIELD(Optional<Bool>, singleChannelDirectMode);
  FIELD(Optional<Bool>, useStunMessageIntegrity);
  FIELD(Optional<Bool>, useSecureHLControlMessage);
  /// The offer itself; opaque here.
  FIELD(Optional<Data>, blob);
  FIELD(Optional<Bool>, messageIsRealTime);
  /// The caller's key. Nothing vouches for it yet.
  FIELD(Optional<Data>, unauthenticatedPublicKey);
  FIELD(Optional<Bool>, assumeRemoteDeviceEncryption);
  /// Opaque to everybody but the two ends.
  FIELD(Optional<Data>, sessionMessageContext);
  FIELD(Optional<Bool>, usePhoneTetherLocalMessage);
  /// Who calls, and in which session, as they say.
  FIELD(String, participantID);
  FIELD(Bool, declineOnNetworkError);
  FIELD(String, sessionID);
  FIELD(Optional<Bool>, needsToWaitForPreConnectionData);
  FIELD(Optional<Bool>, useCloudPairedControlChannel);

  LABELS(VespSessionInvitation);
};

/// The call is taken. What an invitation calls the sender's own is `remote` here: it is seen from
/// the caller.
struct VespSessionAccept {
  FIELD(UInt, version);
  /// The answer itself; opaque here.
  FIELD(Optional<Data>, blob);
  FIELD(String, sessionID);
  FIELD(String, participantID);
  FIELD(Optional<Data>, sessionMessageContext);
  FIELD(Optional<Bool>, useCloudPairedControlChannel);
  FIELD(Optional<Bool>, useStunMessageIntegrity);
  FIELD(Optional<Bool>, useSecureHLControlMessage);
  FIELD(Optional<Data>, unauthenticatedPublicKey);
  FIELD(Optional<Bool>, remoteUsePhoneTetherLocalMessage);
  /// What the other side's media are secured with, and where its streams begin.
  FIELD(Optional<Data>, remoteKeyMaterialData);
  /// Deliberate: signed, as they travel.
  FIELD(Optional<Int>, remoteSSRC);
  FIELD(Optional<Int>, remoteSecStart);

  LABELS(VespSessionAccept);
};

/// The call is refused. Deliberate: declined elsewhere gives this record too, and which of the two
/// commands it came with is not kept.
struct VespSessionDecline {
  FIELD(UInt, version);
  FIELD(String, sessionID);
  FIELD(String, participantID);
  FIELD(Optional<Data>, sessionMessageContext);

  LABELS(VespSessionDecline);
};

/// The caller takes the offer back, or a participant leaves.
struct VespSessionCancel {
  /// Why the other side says that it ended.
  NESTED_ENUMERATION(VespSessionEndedReason, UInt, unknown = 0, localHangUp = 1, remoteHangUp = 2,
                     noAnswer = 3, answeredElsewhere = 4, declinedElsewhere = 5, busy = 6,
                     networkFailure = 7, mediaFailure = 8);

  FIELD(UInt, version);
  FIELD(String, sessionID);
  FIELD(String, participantID);
  /// Absent when the sender gave none.
  FIELD(Optional<VespSessionEndedReason>, remoteEndReason);
  FIELD(Optional<Data>, sessionMessageContext);

  LABELS(VespSessionCancel);
};

/// A running session is set up anew.
struct VespSessionReinitiate {
  /// There is no default: to do the wrong thing anew would be worse than to do nothing.
  NESTED_ENUMERATION(VespSessionReinitiateSubcommand, UInt, restartConnection = 0,
                     renegotiateMedia = 1, switchTransport = 2, rekey = 3);

  FIELD(UInt, version);
  FIELD(String, sessionID);
  FIELD(String, participantID);
  /// What is to be done anew.
  FIELD(VespSessionReinitiateSubcommand, sessionReinitiateSubcommand);

  LABELS(VespSessionReinitiate);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
