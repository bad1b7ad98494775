// SPDX-License-Identifier: Apache-2.0
/// The smallest complete path through the service, and the model of the others.
#pragma once

#include "program/service/vesp_sample_message_schema.h"
#include "program/service_unpacker/vesp_service_unpacker.h"

namespace VespKeelgateService {

/// A value without fields; callable from any thread.
struct VespSampleMessageUnpacker {
  using SchemaType = VespClientMessageResult;
  using Context = VespClientMessageContext;
  using Commands =
      Keelgate::TypeList<OnAnyCommand<VespSampleMessageSchema, Keelgate::VespSampleMessage>>;

  /// Throws Breach for an unknown command, and DecodingError.
  VespClientMessageResult unpack(Bytes from, const Context& with) const;
};

}  // namespace VespKeelgateService
