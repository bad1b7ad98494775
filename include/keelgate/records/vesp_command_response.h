// SPDX-License-Identifier: Apache-2.0
/// The delivery service's short answer to a command. A value that owns all that it holds; separate
/// ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// Only the command number is always there. Nothing ties the answer to a command that was asked:
/// whoever sent that compares the numbers.
struct VespCommandResponse {
  FIELD(Int, command);
  /// The message that is answered, by number or by identifier. Deliberate: a number here, a text in
  /// payloads.
  FIELD(Optional<Int64>, messageId);
  FIELD(Optional<Data>, messageUUID);
  /// How it went, in the delivery service's codes.
  FIELD(Optional<Int>, responseStatus);
  FIELD(Optional<Int>, failReason);
  /// Opaque octets.
  FIELD(Optional<Data>, token);
  FIELD(Optional<Bool>, internalBuild);
  FIELD(Optional<Bool>, loggingProfile);
  /// The relay session that the command was about.
  FIELD(Optional<String>, applicationId);
  FIELD(Optional<Int>, requestType);
  FIELD(Optional<Data>, vespSessionId);
  FIELD(Optional<Bool>, sharedSession);
  FIELD(Optional<Int>, protocolVersion);

  LABELS(VespCommandResponse);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
