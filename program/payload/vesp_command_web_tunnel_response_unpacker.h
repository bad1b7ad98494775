// SPDX-License-Identifier: Apache-2.0
/// Web-tunnel responses. A value without fields; callable from any thread.
#pragma once

#include "program/payload/vesp_command_web_tunnel_response_schema.h"

#include <keelgate/records/vesp_command_web_tunnel_response.h>

namespace VespKeelgateService {

struct VespCommandWebTunnelResponseUnpacker {
  using SchemaType = Keelgate::VespCommandWebTunnelResponse;
  using Schema = VespCommandWebTunnelResponseSchema;

  /// Throws DecodingError.
  SchemaType unpack(Bytes from) const;
};

}  // namespace VespKeelgateService
