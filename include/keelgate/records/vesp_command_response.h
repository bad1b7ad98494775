// SPDX-License-Identifier: Apache-2.0
/// The delivery service's short answer to a command. A value that owns all that it holds; separate
/// ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

namespace Keelgate {

/// Only the command number is always present. Nothing ties the answer to a command that was sent:
/// the sender of the command has to compare the numbers.
struct VespCommandResponse {
  KEELGATE_RECORD(VespCommandResponse,
      (Int, command),
      /// The message that is answered, by number or by identifier. Deliberate: a number here, a
      /// string in payloads.
      (Optional<Int64>, messageId),
      (Optional<Data>, messageUUID),
      /// How it went, in the delivery service's codes.
      (Optional<Int>, responseStatus),
      (Optional<Int>, failReason),
      /// Opaque octets.
      (Optional<Data>, token),
      (Optional<Bool>, internalBuild),
      (Optional<Bool>, loggingProfile),
      /// The relay session that the command was about.
      (Optional<String>, applicationId),
      (Optional<Int>, requestType),
      (Optional<Data>, vespSessionId),
      (Optional<Bool>, sharedSession),
      (Optional<Int>, protocolVersion));
};

}  // namespace Keelgate
