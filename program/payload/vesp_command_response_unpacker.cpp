// SPDX-License-Identifier: Apache-2.0
#include "program/payload/vesp_command_response_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/schema/property_list_decoder.h"

namespace VespKeelgateService {

Keelgate::VespCommandResponse VespCommandResponseUnpacker::unpack(Bytes from) const {
  return Keelgate::construct(PropertyListDecoder().decode<Schema, SchemaType>(from));
}

}  // namespace VespKeelgateService
