// SPDX-License-Identifier: Apache-2.0
/// The answer to an HTTP request made on the device's behalf. Deliberate: its message number is no
/// string.
#pragma once

#include "program/payload/vesp_payload_nested_schemas.h"
#include "program/schema/values.h"

#include <keelgate/describe.h>

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

/// Only the command is required. "h" is the dictionary of headers here as in a payload.
struct VespCommandWebTunnelResponseSchema {
  FIELD(Int, command, "c");
  FIELD(Optional<Int>, messageId, "i");
  FIELD(Optional<Data>, messageUUID, "U");
  FIELD(Optional<Int>, responseStatus, "s");
  FIELD(Optional<String>, contentType, "cT");
  FIELD(Optional<Int64>, epochTimeNanos, "e");
  FIELD(Optional<String>, httpUrl, "u");
  FIELD(Optional<VespOstrelProtocolHttpHeaders>, httpHeaders, "h");
  FIELD(Optional<Data>, httpBody, "b");
  FIELD(Optional<String>, httpBodyUrl, "bu");
  FIELD(Optional<Data>, httpBodyKey, "bk");
  FIELD(Optional<Int>, httpResponseStatus, "hs");
  FIELD(Optional<String>, httpErrorMsg, "hr");

  CODING_KEYS(VespCommandWebTunnelResponseSchema);
};

}  // namespace VespKeelgateService

#include <keelgate/describe_end.h>
