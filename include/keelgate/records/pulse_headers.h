// SPDX-License-Identifier: Apache-2.0
/// The HTTP headers that push payloads and web-tunnel responses carry. A value that owns its texts;
/// separate ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

namespace Keelgate {

/// Every value is as it was received. Check them before you send them on: a value may contain a
/// line break, and with it a header that the attacker wrote.
struct PulseUserPayloadHttpHeaders {
  KEELGATE_RECORD(PulseUserPayloadHttpHeaders,
      (Optional<String>, adhocServiceOverride),
      (Optional<String>, responseIdentifierString),
      (Optional<String>, strictTransportSecurity),
      (Optional<String>, traceId),
      (Optional<String>, splunkHint),
      (Optional<String>, asHttpHeader));
};

}  // namespace Keelgate
