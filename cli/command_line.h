// SPDX-License-Identifier: Apache-2.0
/// What the command line asks for.
#pragma once

#include "cli/console.h"

#include <keelgate/values.h>

#include <functional>

namespace Keelgate::CLI {

struct CommandLine {
  /// Does what was asked for. Empty: help was printed, or the usage was wrong, which is said and
  /// noted.
  std::function<void(Console&)> run;
  LogLevel logLevel = LogLevel::warning;
};

/// `words` are without the command's own name. Throws nothing but std::bad_alloc.
CommandLine readCommandLine(Array<String> words, std::string_view version, Console& console);

}  // namespace Keelgate::CLI
