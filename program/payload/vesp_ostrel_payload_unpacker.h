// SPDX-License-Identifier: Apache-2.0
/// Push payloads. A value without fields; callable from any thread.
#pragma once

#include "program/payload/vesp_ostrel_protocol_payload.h"

#include <keelgate/records/pulse_user_payload.h>

namespace VespKeelgateService {

struct VespOstrelPayloadUnpacker {
  using SchemaType = Keelgate::PulseUserPayload;
  using Schema = VespOstrelProtocolPayload;

  /// Throws DecodingError. Takes stack for every payload inside a payload: at most 256 of them,
  /// which the worker's stack has room for twice over.
  SchemaType unpack(Bytes from) const;

  /// The constructors of all records in the payload, and its own. Throws only what they throw.
  static void constructPayload(const Keelgate::PulseUserPayload& payload);
};

}  // namespace VespKeelgateService
