// SPDX-License-Identifier: Apache-2.0
/// The sample message of the conferencing test tool.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

/// Deliberate: the name travels as "client". A key "clientName" is an unknown one.
struct VespSampleMessageSchema {
  FIELD(Int, command);
  FIELD(String, clientName, "client");
  FIELD(Optional<Date>, date);
  FIELD(Optional<Int>, version);

  CODING_KEYS(VespSampleMessageSchema);
};

}  // namespace VespKeelgateService

#include <keelgate/describe_end.h>
