// SPDX-License-Identifier: Apache-2.0
/// The HTTP headers that push payloads and web-tunnel responses carry. A value that owns its texts;
/// separate ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// Every value is as it was received. Whoever sends them on checks them first: nothing here keeps a
/// line end out of a value, and with it a header that somebody else wrote.
struct PulseUserPayloadHttpHeaders {
  FIELD(Optional<String>, adhocServiceOverride);
  FIELD(Optional<String>, responseIdentifierString);
  FIELD(Optional<String>, strictTransportSecurity);
  FIELD(Optional<String>, traceId);
  FIELD(Optional<String>, splunkHint);
  FIELD(Optional<String>, asHttpHeader);

  LABELS(PulseUserPayloadHttpHeaders);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
