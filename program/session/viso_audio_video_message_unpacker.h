// SPDX-License-Identifier: Apache-2.0
/// The messages of the video and the audio call service. The command number alone selects the
/// schema; which of the two services a message came from makes no difference.
#pragma once

#include "program/service_unpacker/vesp_service_unpacker.h"
#include "program/session/vesp_session_schemas.h"

namespace VespKeelgateService {

/// A value without fields; callable from any thread.
struct VisoAudioVideoMessageUnpacker {
  using SchemaType = VespClientMessageResult;
  using Context = VespClientMessageContext;
  using Commands = Keelgate::TypeList<
      On<CommandType::Case::sessionInvitation, VespSessionInvitationSchema,
         Keelgate::VespSessionInvitation>,
      On<CommandType::Case::sessionAccept, VespSessionAcceptSchema, Keelgate::VespSessionAccept>,
      On<CommandType::Case::sessionDecline, VespSessionDeclineSchema, Keelgate::VespSessionDecline>,
      On<CommandType::Case::sessionCancel, VespSessionCancelSchema, Keelgate::VespSessionCancel>,
      // Deliberate: sessionMessage (236) is a gap. Like every number without a row it is refused
      // as unimplemented. Deliberate: sessionDeclineElsewhere declines too; nothing records which
      // of the two numbers was used.
      On<CommandType::Case::sessionDeclineElsewhere, VespSessionDeclineSchema,
         Keelgate::VespSessionDecline>,
      On<CommandType::Case::sessionReinitiate, VespSessionReinitiateSchema,
         Keelgate::VespSessionReinitiate>>;

  /// Throws Breach for an unknown command, VespClientMessageUnpackingError for one without a row,
  /// and DecodingError.
  VespClientMessageResult unpack(Bytes from, const Context& with) const;
};

}  // namespace VespKeelgateService
