// SPDX-License-Identifier: Apache-2.0
/// The delivery service's short answer to a command.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// Only the command number is always there.
struct VespCommandResponse {
  FIELD(Int, command);
  /// The message that is answered.
  FIELD(Optional<Int64>, messageId);
  FIELD(Optional<Data>, messageUUID);
  /// How it went.
  FIELD(Optional<Int>, responseStatus);
  FIELD(Optional<Int>, failReason);
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
