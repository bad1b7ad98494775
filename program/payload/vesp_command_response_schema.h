// SPDX-License-Identifier: Apache-2.0
/// The delivery service's answer to a command. Deliberate: its message number is not a string.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

namespace VespKeelgateService {

/// Only the command is required.
struct VespCommandResponseSchema {
  KEELGATE_SCHEMA(VespCommandResponseSchema,
      (Int, command, "c"),
      (Optional<Int64>, messageId, "i"),
      (Optional<Data>, messageUUID, "U"),
      (Optional<Int>, responseStatus, "s"),
      (Optional<Int>, failReason, "fR"),
      (Optional<Data>, token, "t"),
      (Optional<Bool>, internalBuild, "x-internal"),
      (Optional<Bool>, loggingProfile, "x-logging"),
      (Optional<String>, applicationId, "qai"),
      (Optional<Int>, requestType, "qat"),
      (Optional<Data>, vespSessionId, "qvesp"),
      (Optional<Bool>, sharedSession, "hlss"),
      (Optional<Int>, protocolVersion, "qv"));
};

}  // namespace VespKeelgateService
