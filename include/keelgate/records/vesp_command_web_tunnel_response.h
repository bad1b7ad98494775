// SPDX-License-Identifier: Apache-2.0
/// The answer to an HTTP request that the delivery service made for the device. A value that owns
/// all that it holds; separate ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/records/pulse_headers.h>
#include <keelgate/values.h>

namespace Keelgate {

/// `httpBody` is the stored or inline body, of any length. Only the command number is always
/// present. Body and headers come from the HTTP server, which is a third party and not the delivery
/// service.
struct VespCommandWebTunnelResponse {
  KEELGATE_RECORD(VespCommandWebTunnelResponse,
      (Int, command),
      /// The message that is answered, by number or by identifier. Deliberate: a number here, a
      /// string in payloads.
      (Optional<Int>, messageId),
      (Optional<Data>, messageUUID),
      (Optional<Int>, responseStatus),
      (Optional<String>, contentType),
      /// In nanoseconds, as the sender counts.
      (Optional<Int64>, epochTimeNanos),
      /// Any text: it need not be a URL, nor the one that was requested.
      (Optional<String>, httpUrl),
      /// Absent when the message had none.
      (Optional<PulseUserPayloadHttpHeaders>, httpHeaders),
      (Optional<Data>, httpBody),
      /// Where a body that was too large to carry is stored, and the key to decrypt it.
      (Optional<String>, httpBodyUrl),
      (Optional<Data>, httpBodyKey),
      /// The status of the HTTP exchange; responseStatus is that of the delivery.
      (Optional<Int>, httpResponseStatus),
      (Optional<String>, httpErrorMsg));
};

}  // namespace Keelgate
