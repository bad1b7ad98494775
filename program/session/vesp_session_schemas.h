// SPDX-License-Identifier: Apache-2.0
/// The messages of the two call services. All share the leading triple of version, session and
/// participant; a key that means the same is spelt the same.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>
#include <keelgate/records/vesp_session.h>

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

/// The largest, and the only one that says how media travel.
struct VespSessionInvitationSchema {
  using TransportType = Keelgate::VespSessionInvitation::TransportType;

  FIELD(TransportType, transportType, "t");
  FIELD(UInt, version, "v");
  FIELD(Optional<UInt>, connectionCountHint, "ch");
  FIELD(Optional<Bool>, disableEncryption, "de");
  FIELD(Optional<Bool>, singleChannelDirectMode, "sd");
  FIELD(Optional<Bool>, useStunMessageIntegrity, "mi");
  FIELD(Optional<Bool>, useSecureHLControlMessage, "shl");
  FIELD(Optional<Data>, blob, "b");
  FIELD(Optional<Bool>, messageIsRealTime, "rt");
  // Deliberate: spelt out, unlike its neighbours.
  FIELD(Optional<Data>, unauthenticatedPublicKey, "unauthenticated-public-key");
  FIELD(Optional<Bool>, assumeRemoteDeviceEncryption, "re");
  FIELD(Optional<Data>, sessionMessageContext, "c");
  FIELD(Optional<Bool>, usePhoneTetherLocalMessage, "pclm");
  FIELD(String, participantID, "p");
  // Deliberate: the one boolean that is required.
  FIELD(Bool, declineOnNetworkError, "d");
  FIELD(String, sessionID, "s");
  FIELD(Optional<Bool>, needsToWaitForPreConnectionData, "pcd");
  FIELD(Optional<Bool>, useCloudPairedControlChannel, "cc");

  CODING_KEYS(VespSessionInvitationSchema);
};

/// Keys that it shares with the invitation mean the same, but for "pclm".
struct VespSessionAcceptSchema {
  FIELD(UInt, version, "v");
  FIELD(Optional<Data>, blob, "b");
  FIELD(String, sessionID, "s");
  FIELD(String, participantID, "p");
  FIELD(Optional<Data>, sessionMessageContext, "c");
  FIELD(Optional<Bool>, useCloudPairedControlChannel, "cc");
  FIELD(Optional<Bool>, useStunMessageIntegrity, "mi");
  FIELD(Optional<Bool>, useSecureHLControlMessage, "shl");
  FIELD(Optional<Data>, unauthenticatedPublicKey, "unauthenticated-public-key");
  // What the sender of the invitation calls its own is the other side's here.
  FIELD(Optional<Bool>, remoteUsePhoneTetherLocalMessage, "pclm");
  FIELD(Optional<Data>, remoteKeyMaterialData, "k");
  // Deliberate: signed, unlike the version.
  FIELD(Optional<Int>, remoteSSRC, "ss");
  FIELD(Optional<Int>, remoteSecStart, "sq");

  CODING_KEYS(VespSessionAcceptSchema);
};

struct VespSessionDeclineSchema {
  FIELD(UInt, version, "v");
  FIELD(String, sessionID, "s");
  FIELD(String, participantID, "p");
  FIELD(Optional<Data>, sessionMessageContext, "c");

  CODING_KEYS(VespSessionDeclineSchema);
};

/// The reason may be absent, but not unknown.
struct VespSessionCancelSchema {
  using VespSessionEndedReason = Keelgate::VespSessionCancel::VespSessionEndedReason;

  FIELD(UInt, version, "v");
  FIELD(String, sessionID, "s");
  FIELD(String, participantID, "p");
  FIELD(Optional<VespSessionEndedReason>, remoteEndReason, "e");
  FIELD(Optional<Data>, sessionMessageContext, "c");

  CODING_KEYS(VespSessionCancelSchema);
};

/// The subcommand is required, and no number stands for an unknown one.
struct VespSessionReinitiateSchema {
  using VespSessionReinitiateSubcommand =
      Keelgate::VespSessionReinitiate::VespSessionReinitiateSubcommand;

  FIELD(UInt, version, "v");
  FIELD(String, sessionID, "s");
  FIELD(String, participantID, "p");
  FIELD(VespSessionReinitiateSubcommand, sessionReinitiateSubcommand, "ri");

  CODING_KEYS(VespSessionReinitiateSchema);
};

}  // namespace VespKeelgateService

#include <keelgate/describe_end.h>
