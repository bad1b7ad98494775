// SPDX-License-Identifier: Apache-2.0
/// The record of the conferencing test tool's messages.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

#include <keelgate/describe_begin.h>

namespace Keelgate {

struct VespSampleMessage {
  /// The command number that the message itself states.
  FIELD(Optional<Int>, command);
  FIELD(Optional<String>, clientName);
  FIELD(Optional<Date>, date);
  FIELD(Optional<Int>, version);

  LABELS(VespSampleMessage);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
