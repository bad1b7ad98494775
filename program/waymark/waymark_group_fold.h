// SPDX-License-Identifier: Apache-2.0
/// Gathers the numbered recipient fields of a check-in into one record for each group.
#pragma once

#include "program/waymark/waymark_schema.h"

#include <keelgate/records/waymark_message.h>

namespace VespKeelgateService {

/// The groups 2 to 32, each exactly once, also where all their fields are absent. Empties the
/// numbered fields of the schema. Throws what the constructor of WaymarkGroupFields throws.
Array<Keelgate::WaymarkGroupFields> foldGroups(WaymarkSchema& schema);

}  // namespace VespKeelgateService
