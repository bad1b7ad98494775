// SPDX-License-Identifier: Apache-2.0
/// The record of the conferencing test tool's messages. A value that owns its text; separate ones
/// may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

namespace Keelgate {

/// All fields are optional because the framework's record is defined so; the service always sets
/// the first two.
struct VespSampleMessage {
  KEELGATE_RECORD(VespSampleMessage,
      /// The command number that the message itself states. Deliberate: it may differ from the
      /// command that the message arrived with.
      (Optional<Int>, command),
      (Optional<String>, clientName),
      (Optional<Date>, date),
      (Optional<Int>, version));
};

}  // namespace Keelgate
