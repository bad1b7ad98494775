// SPDX-License-Identifier: Apache-2.0
/// The answer to an HTTP request that the delivery service made for the device. A value that owns
/// all that it holds; separate ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/records/pulse_headers.h>
#include <keelgate/values.h>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// `httpBody` is the stored or inline body, of any length. Only the command number is always there.
/// Body and headers come from the server that was asked, so they are a third party's and not the
/// delivery service's.
struct VespCommandWebTunnelResponse {
  FIELD(Int, command);
  /// The message that is answered, by number or by identifier. Deliberate: a number here, a text in
  /// payloads.
  FIELD(Optional<Int>, messageId);
  FIELD(Optional<Data>, messageUUID);
  FIELD(Optional<Int>, responseStatus);
  FIELD(Optional<String>, contentType);
  /// In nanoseconds, as the sender counts.
  FIELD(Optional<Int64>, epochTimeNanos);
  /// Any text: that it is a URL, or the one that was asked for, is not checked.
  FIELD(Optional<String>, httpUrl);
  /// Absent when the message had none.
  FIELD(Optional<PulseUserPayloadHttpHeaders>, httpHeaders);
  FIELD(Optional<Data>, httpBody);
  /// Where a body is that was too large to carry, and the key that opens it.
  FIELD(Optional<String>, httpBodyUrl);
  FIELD(Optional<Data>, httpBodyKey);
  /// Of the HTTP exchange, where responseStatus is the delivery's.
  FIELD(Optional<Int>, httpResponseStatus);
  FIELD(Optional<String>, httpErrorMsg);

  LABELS(VespCommandWebTunnelResponse);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
