// SPDX-License-Identifier: Apache-2.0
/// The delivery service's answer to a command, and to an HTTP request that it made on the device's
/// behalf. Deliberate: their message numbers are not strings.
#pragma once

#include "program/payload/vesp_payload_nested_schemas.h"
#include "program/schema/values.h"

#include <keelgate/describe.h>

namespace VespKeelgateService {

/// Only the command is required.
struct VespCommandResponseSchema {
  KEELGATE_SCHEMA(VespCommandResponseSchema,
      (Int, command, "c"),
      (Optional<Int64>, messageId, "i"),
      (Optional<Data>, messageUUID, "U"),
      (Optional<Int>, responseStatus, "s"),
      (Optional<Int>, failReason, "fR"),
      (Optional<Data>, token, "t"),
      (Optional<Bool>, internalBuild, "x-internal"),
      (Optional<Bool>, loggingProfile, "x-logging"),
      (Optional<String>, applicationId, "qai"),
      (Optional<Int>, requestType, "qat"),
      (Optional<Data>, vespSessionId, "qvesp"),
      (Optional<Bool>, sharedSession, "hlss"),
      (Optional<Int>, protocolVersion, "qv"));
};

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
