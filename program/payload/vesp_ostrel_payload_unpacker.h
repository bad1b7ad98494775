// SPDX-License-Identifier: Apache-2.0
/// Push payloads.
#pragma once

#include "program/payload/vesp_ostrel_protocol_payload.h"

#include <keelgate/records/pulse_user_payload.h>

namespace VespKeelgateService {

struct VespOstrelPayloadUnpacker {
  using SchemaType = Keelgate::PulseUserPayload;
  using Schema = VespOstrelProtocolPayload;

  SchemaType unpack(Bytes from) const;

  /// Payloads inside the payload are converted first. Throws only what a record's constructor
  /// throws.
  static Keelgate::PulseUserPayload convertPayload(VespOstrelProtocolPayload&& payload);
};

}  // namespace VespKeelgateService
