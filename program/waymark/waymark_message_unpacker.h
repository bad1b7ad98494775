// SPDX-License-Identifier: Apache-2.0
/// Safety check-ins. Every known command of the service carries the same message.
#pragma once

#include "program/service_unpacker/vesp_service_unpacker.h"
#include "program/waymark/waymark_schema.h"

namespace VespKeelgateService {

/// A value without fields; callable from any thread.
struct WaymarkMessageUnpacker {
  using SchemaType = VespClientMessageResult;
  using Context = VespClientMessageContext;
  using Commands = Keelgate::TypeList<OnAnyCommand<WaymarkSchema, Keelgate::WaymarkMessage>>;

  /// Throws Breach for an unknown command, and DecodingError.
  VespClientMessageResult unpack(Bytes from, const Context& with) const;
};

}  // namespace VespKeelgateService
