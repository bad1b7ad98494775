// SPDX-License-Identifier: Apache-2.0
/// The answer to an HTTP request made on the device's behalf. Deliberate: its message number is no
/// string.
#pragma once

#include "program/payload/vesp_payload_nested_schemas.h"
#include "program/schema/values.h"

#include <keelgate/describe.h>

namespace VespKeelgateService {

/// Only the command is required. "h" is the dictionary of headers here as in a payload.
struct VespCommandWebTunnelResponseSchema {
  KEELGATE_SCHEMA(VespCommandWebTunnelResponseSchema,
      (Int, command, "c"),
      (Optional<Int>, messageId, "i"),
      (Optional<Data>, messageUUID, "U"),
      (Optional<Int>, responseStatus, "s"),
      (Optional<String>, contentType, "cT"),
      (Optional<Int64>, epochTimeNanos, "e"),
      (Optional<String>, httpUrl, "u"),
      (Optional<VespOstrelProtocolHttpHeaders>, httpHeaders, "h"),
      (Optional<Data>, httpBody, "b"),
      (Optional<String>, httpBodyUrl, "bu"),
      (Optional<Data>, httpBodyKey, "bk"),
      (Optional<Int>, httpResponseStatus, "hs"),
      (Optional<String>, httpErrorMsg, "hr"));
};

}  // namespace VespKeelgateService
