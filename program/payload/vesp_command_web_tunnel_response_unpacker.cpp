// SPDX-License-Identifier: Apache-2.0
#include "program/payload/vesp_command_web_tunnel_response_unpacker.h"

#include "program/payload/payload_conversions.h"
#include "program/schema/property_list_decoder.h"

namespace VespKeelgateService {

using Keelgate::PulseUserPayloadHttpHeaders;
using Keelgate::VespCommandWebTunnelResponse;

VespCommandWebTunnelResponse VespCommandWebTunnelResponseUnpacker::unpack(Bytes from) const {
  auto schema = PropertyListDecoder().decode<Schema>(from);
  auto headers = convertIfPresent<PulseUserPayloadHttpHeaders>(std::move(schema.httpHeaders));
  return Keelgate::construct(fieldByField<VespCommandWebTunnelResponse>(
      std::move(schema), label<&VespCommandWebTunnelResponse::httpHeaders> = std::move(headers)));
}

}  // namespace VespKeelgateService
