// SPDX-License-Identifier: Apache-2.0
/// The delivery service's answers to commands. A value without fields; callable from any thread.
#pragma once

#include "program/payload/vesp_command_response_schema.h"

#include <keelgate/records/vesp_command_response.h>

namespace VespKeelgateService {

struct VespCommandResponseUnpacker {
  using SchemaType = Keelgate::VespCommandResponse;
  using Schema = VespCommandResponseSchema;

  /// Throws DecodingError.
  SchemaType unpack(Bytes from) const;
};

}  // namespace VespKeelgateService
