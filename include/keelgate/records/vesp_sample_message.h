// SPDX-License-Identifier: Apache-2.0
/// The record of the conferencing test tool's messages. A value that owns its text; separate ones
/// may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

namespace Keelgate {

/// The fields are optional because the framework's record is so; the service always gives the first
/// two.
struct VespSampleMessage {
  KEELGATE_RECORD(VespSampleMessage,
      /// The command number that the message itself states. Deliberate: it may be another than the
      /// one that the message arrived with.
      (Optional<Int>, command),
      (Optional<String>, clientName),
      (Optional<Date>, date),
      (Optional<Int>, version));
};

}  // namespace Keelgate
