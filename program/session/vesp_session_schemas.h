// SPDX-License-Identifier: Apache-2.0
/// The messages of the two call services. All share the leading triple of version, session and
/// participant; a key that means the same is spelt the same.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>
#include <keelgate/records/vesp_session.h>

namespace VespKeelgateService {

/// The largest, and the only one that says how media travel.
struct VespSessionInvitationSchema {
  using TransportType = Keelgate::VespSessionInvitation::TransportType;

  KEELGATE_SCHEMA(VespSessionInvitationSchema,
      (TransportType, transportType, "t"),
      (UInt, version, "v"),
      (Optional<UInt>, connectionCountHint, "ch"),
      (Optional<Bool>, disableEncryption, "de"),
      (Optional<Bool>, singleChannelDirectMode, "sd"),
      (Optional<Bool>, useStunMessageIntegrity, "mi"),
      (Optional<Bool>, useSecureHLControlMessage, "shl"),
      (Optional<Data>, blob, "b"),
      (Optional<Bool>, messageIsRealTime, "rt"),
      // Deliberate: spelt out, unlike its neighbours.
      (Optional<Data>, unauthenticatedPublicKey, "unauthenticated-public-key"),
      (Optional<Bool>, assumeRemoteDeviceEncryption, "re"),
      (Optional<Data>, sessionMessageContext, "c"),
      (Optional<Bool>, usePhoneTetherLocalMessage, "pclm"),
      (String, participantID, "p"),
      // Deliberate: the one boolean that is required.
      (Bool, declineOnNetworkError, "d"),
      (String, sessionID, "s"),
      (Optional<Bool>, needsToWaitForPreConnectionData, "pcd"),
      (Optional<Bool>, useCloudPairedControlChannel, "cc"));
};

/// Keys that it shares with the invitation mean the same, but for "pclm".
struct VespSessionAcceptSchema {
  KEELGATE_SCHEMA(VespSessionAcceptSchema,
      (UInt, version, "v"),
      (Optional<Data>, blob, "b"),
      (String, sessionID, "s"),
      (String, participantID, "p"),
      (Optional<Data>, sessionMessageContext, "c"),
      (Optional<Bool>, useCloudPairedControlChannel, "cc"),
      (Optional<Bool>, useStunMessageIntegrity, "mi"),
      (Optional<Bool>, useSecureHLControlMessage, "shl"),
      (Optional<Data>, unauthenticatedPublicKey, "unauthenticated-public-key"),
      // What the sender of the invitation calls its own is the other side's here.
      (Optional<Bool>, remoteUsePhoneTetherLocalMessage, "pclm"),
      (Optional<Data>, remoteKeyMaterialData, "k"),
      // Deliberate: signed, unlike the version.
      (Optional<Int>, remoteSSRC, "ss"),
      (Optional<Int>, remoteSecStart, "sq"));
};

struct VespSessionDeclineSchema {
  KEELGATE_SCHEMA(VespSessionDeclineSchema,
      (UInt, version, "v"),
      (String, sessionID, "s"),
      (String, participantID, "p"),
      (Optional<Data>, sessionMessageContext, "c"));
};

/// The reason may be absent, but not unknown.
struct VespSessionCancelSchema {
  using VespSessionEndedReason = Keelgate::VespSessionCancel::VespSessionEndedReason;

  KEELGATE_SCHEMA(VespSessionCancelSchema,
      (UInt, version, "v"),
      (String, sessionID, "s"),
      (String, participantID, "p"),
      (Optional<VespSessionEndedReason>, remoteEndReason, "e"),
      (Optional<Data>, sessionMessageContext, "c"));
};

/// The subcommand is required, and no number stands for an unknown one.
struct VespSessionReinitiateSchema {
  using VespSessionReinitiateSubcommand =
      Keelgate::VespSessionReinitiate::VespSessionReinitiateSubcommand;

  KEELGATE_SCHEMA(VespSessionReinitiateSchema,
      (UInt, version, "v"),
      (String, sessionID, "s"),
      (String, participantID, "p"),
      (VespSessionReinitiateSubcommand, sessionReinitiateSubcommand, "ri"));
};

}  // namespace VespKeelgateService
