// SPDX-License-Identifier: Apache-2.0
/// The sample message of the conferencing test tool.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

namespace VespKeelgateService {

/// Deliberate: the name travels as "client". A key "clientName" is an unknown one.
struct VespSampleMessageSchema {
  KEELGATE_SCHEMA(VespSampleMessageSchema,
      (Int, command),
      (String, clientName, "client"),
      (Optional<Date>, date),
      (Optional<Int>, version));
};

}  // namespace VespKeelgateService
