// SPDX-License-Identifier: Apache-2.0
/// The live-photo service. Its messages are answered with a marker and never decoded, so that
/// nothing of their content crosses the sandbox's wall.
#pragma once

#include "program/service_unpacker/vesp_service_unpacker.h"

namespace VespKeelgateService {

/// A value without fields; callable from any thread.
struct VisoLivePhotoMessageUnpacker {
  using SchemaType = VespClientMessageResult;
  using Context = VespClientMessageContext;
  using Commands = Keelgate::TypeList<
      On<CommandType::Case::livePhoto, NoSchema, Keelgate::VespRestrictedMessage>>;

  /// Deliberate: any bytes will do, none and damaged ones too. Throws Breach for an unknown
  /// command, and VespClientMessageUnpackingError for any other than the table's.
  VespClientMessageResult unpack(Bytes from, const Context& with) const;
};

}  // namespace VespKeelgateService
