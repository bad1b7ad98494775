// SPDX-License-Identifier: Apache-2.0
/// The delivery service's answers to commands, and to HTTP requests that it made for the device.
/// Values without fields; callable from any thread.
#pragma once

#include "program/payload/vesp_command_response_schemas.h"

#include <keelgate/records/vesp_command_response.h>
#include <keelgate/records/vesp_command_web_tunnel_response.h>

namespace VespKeelgateService {

struct VespCommandResponseUnpacker {
  using SchemaType = Keelgate::VespCommandResponse;
  using Schema = VespCommandResponseSchema;

  /// Throws DecodingError.
  SchemaType unpack(Bytes from) const;
};

struct VespCommandWebTunnelResponseUnpacker {
  using SchemaType = Keelgate::VespCommandWebTunnelResponse;
  using Schema = VespCommandWebTunnelResponseSchema;

  /// Throws DecodingError.
  SchemaType unpack(Bytes from) const;
};

}  // namespace VespKeelgateService
