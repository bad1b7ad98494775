// SPDX-License-Identifier: Apache-2.0
/// JSON Schema (2020-12) of what the command prints, from the tables that it is printed from.
#pragma once

#include "cli/description.h"
#include "framework/json/writer.h"

namespace Keelgate::CLI {

/// Of the value of a record, an enumeration or a case-keyed one; what it contains stands under
/// `$defs`. Without a name of the reply object, with every record. False when nothing that is
/// printed has the name.
Bool writeJsonSchema(JSON::Writer& out, const Description& all, const Optional<String>& name);

}  // namespace Keelgate::CLI
