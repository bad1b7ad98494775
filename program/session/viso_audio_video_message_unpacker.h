// SPDX-License-Identifier: Apache-2.0
/// The messages of the video and the audio call service. The command number alone selects the
/// schema; which of the two services a message came from makes no difference.
#pragma once

#include "program/service/vesp_service_unpacker.h"
#include "program/session/vesp_session_schemas.h"

namespace VespKeelgateService {

/// A value without fields; callable from any thread.
struct VisoAudioVideoMessageUnpacker {
  using SchemaType = VespClientMessageResult;
  using Context = VespClientMessageContext;
  using Commands =
      Keelgate::TypeList<On<232, VespSessionInvitationSchema, Keelgate::VespSessionInvitation>,
                         On<233, VespSessionAcceptSchema, Keelgate::VespSessionAccept>,
                         On<234, VespSessionDeclineSchema, Keelgate::VespSessionDecline>,
                         On<235, VespSessionCancelSchema, Keelgate::VespSessionCancel>,
                         // Deliberate: 236 is a gap. Like every number without a row it is refused
                         // as unimplemented. Deliberate: 237 declines too; nothing records which of
                         // the two numbers was used.
                         On<237, VespSessionDeclineSchema, Keelgate::VespSessionDecline>,
                         On<238, VespSessionReinitiateSchema, Keelgate::VespSessionReinitiate>>;

  /// Throws Breach for an unknown command, VespClientMessageUnpackingError for one without a row,
  /// and DecodingError.
  VespClientMessageResult unpack(Bytes from, const Context& with) const;
};

}  // namespace VespKeelgateService
