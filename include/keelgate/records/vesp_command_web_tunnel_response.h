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
  /// The message that is answered.
  FIELD(Optional<Int>, messageId);
  FIELD(Optional<Data>, messageUUID);
  FIELD(Optional<Int>, responseStatus);
  FIELD(Optional<String>, contentType);
  /// In nanoseconds, as the sender counts.
  FIELD(Optional<Int64>, epochTimeNanos);
  FIELD(Optional<String>, httpUrl);
  /// Absent when the message had none.
  FIELD(Optional<PulseUserPayloadHttpHeaders>, httpHeaders);
  FIELD(Optional<Data>, httpBody);
  /// Where a body is that was too large to carry, and the key that opens it.
  FIELD(Optional<String>, httpBodyUrl);
  FIELD(Optional<Data>, httpBodyKey);
  FIELD(Optional<Int>, httpResponseStatus);
  FIELD(Optional<String>, httpErrorMsg);

  LABELS(VespCommandWebTunnelResponse);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
