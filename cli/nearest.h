// SPDX-License-Identifier: Apache-2.0
/// What somebody may have meant who mistyped a name. Pure functions; callable from any thread.
#pragma once

#include <keelgate/values.h>

#include <string_view>

namespace Keelgate::CLI {

/// "did you mean a or b?" with those of the names that are most like `name`, nearest first;
/// `otherwise` when none is like it.
String suggestion(Array<std::string_view> names, std::string_view name, std::string_view otherwise);

}  // namespace Keelgate::CLI
