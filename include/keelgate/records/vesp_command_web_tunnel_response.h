// SPDX-License-Identifier: Apache-2.0
/// The answer to an HTTP request that the delivery service made for the device. A value that owns
/// all that it holds; separate ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/records/pulse_headers.h>
#include <keelgate/values.h>

namespace Keelgate {

/// `httpBody` is the stored or inline body, of any length. Only the command number is always there.
/// Body and headers come from the server that was asked, so they are a third party's and not the
/// delivery service's.
struct VespCommandWebTunnelResponse {
  KEELGATE_RECORD(VespCommandWebTunnelResponse,
      (Int, command),
      /// The message that is answered, by number or by identifier. Deliberate: a number here, a
      /// text in payloads.
      (Optional<Int>, messageId),
      (Optional<Data>, messageUUID),
      (Optional<Int>, responseStatus),
      (Optional<String>, contentType),
      /// In nanoseconds, as the sender counts.
      (Optional<Int64>, epochTimeNanos),
      /// Any text: that it is a URL, or the one that was asked for, is not checked.
      (Optional<String>, httpUrl),
      /// Absent when the message had none.
      (Optional<PulseUserPayloadHttpHeaders>, httpHeaders),
      (Optional<Data>, httpBody),
      /// Where a body is that was too large to carry, and the key that opens it.
      (Optional<String>, httpBodyUrl),
      (Optional<Data>, httpBodyKey),
      /// Of the HTTP exchange, where responseStatus is the delivery's.
      (Optional<Int>, httpResponseStatus),
      (Optional<String>, httpErrorMsg));
};

}  // namespace Keelgate
