// SPDX-License-Identifier: Apache-2.0
/// The delivery service's answer to a command. Deliberate: its message number is no string.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

/// Only the command is required.
struct VespCommandResponseSchema {
  FIELD(Int, command, "c");
  FIELD(Optional<Int64>, messageId, "i");
  FIELD(Optional<Data>, messageUUID, "U");
  FIELD(Optional<Int>, responseStatus, "s");
  FIELD(Optional<Int>, failReason, "fR");
  FIELD(Optional<Data>, token, "t");
  FIELD(Optional<Bool>, internalBuild, "x-internal");
  FIELD(Optional<Bool>, loggingProfile, "x-logging");
  FIELD(Optional<String>, applicationId, "qai");
  FIELD(Optional<Int>, requestType, "qat");
  FIELD(Optional<Data>, vespSessionId, "qvesp");
  FIELD(Optional<Bool>, sharedSession, "hlss");
  FIELD(Optional<Int>, protocolVersion, "qv");

  CODING_KEYS(VespCommandResponseSchema);
};

}  // namespace VespKeelgateService

#include <keelgate/describe_end.h>
