// SPDX-License-Identifier: Apache-2.0
/// Understands the command line, and does what it asks for.
#pragma once

#include "cli/console.h"

#include <keelgate/values.h>

namespace Keelgate::CLI {

/// `words` are without the command's own name. Help is printed; wrong usage is said and noted.
/// Throws what the subcommands throw.
void run(Array<String> words, std::string_view version, Console& console);

}  // namespace Keelgate::CLI
