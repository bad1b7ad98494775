// SPDX-License-Identifier: Apache-2.0
/// JSON Schema (2020-12) of what the command prints, from the tables that it is printed from.
#pragma once

#include "cli/description.h"
#include "framework/json/writer.h"

namespace Keelgate::CLI {

/// Of the value of a record, an enumeration or a case-keyed one; what it contains stands under
/// `$defs`. False when nothing that is printed has this name.
Bool writeJsonSchema(JSON::Writer& out, const Description& all, std::string_view name);

/// Of the reply object, with every record under `$defs`.
void writeReplySchema(JSON::Writer& out, const Description& all);

}  // namespace Keelgate::CLI
