// SPDX-License-Identifier: Apache-2.0
/// The answer to an HTTP request that the delivery service made for the device.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/records/pulse_headers.h>
#include <keelgate/values.h>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// `httpBody` is the stored or inline body, of any length.
struct VespCommandWebTunnelResponse {
  FIELD(Int, command);
  FIELD(Optional<Int>, messageId);
  FIELD(Optional<Data>, messageUUID);
  FIELD(Optional<Int>, responseStatus);
  FIELD(Optional<String>, contentType);
  FIELD(Optional<Int64>, epochTimeNanos);
  FIELD(Optional<String>, httpUrl);
  FIELD(Optional<PulseUserPayloadHttpHeaders>, httpHeaders);
  FIELD(Optional<Data>, httpBody);
  FIELD(Optional<String>, httpBodyUrl);
  FIELD(Optional<Data>, httpBodyKey);
  FIELD(Optional<Int>, httpResponseStatus);
  FIELD(Optional<String>, httpErrorMsg);

  LABELS(VespCommandWebTunnelResponse);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
