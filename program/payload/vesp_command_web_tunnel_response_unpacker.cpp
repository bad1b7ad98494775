// SPDX-License-Identifier: Apache-2.0
#include "program/payload/vesp_command_web_tunnel_response_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/schema/property_list_decoder.h"

namespace VespKeelgateService {

using Keelgate::VespCommandWebTunnelResponse;

VespCommandWebTunnelResponse VespCommandWebTunnelResponseUnpacker::unpack(Bytes from) const {
  auto response = PropertyListDecoder().decode<Schema, VespCommandWebTunnelResponse>(from);
  Keelgate::constructInPlace(response.httpHeaders);
  return Keelgate::construct(std::move(response));
}

}  // namespace VespKeelgateService
