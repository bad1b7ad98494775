// SPDX-License-Identifier: Apache-2.0
/// What the command line asks for.
#pragma once

#include "cli/commands.h"
#include "cli/console.h"

#include <keelgate/client.h>
#include <keelgate/values.h>

namespace Keelgate::CLI {

enum class Action : std::uint8_t {
  /// Help was printed, or the usage was wrong, which is said and noted.
  none,
  unpack,
  stream,
  describe,
  version,
};

/// Of whichever action was chosen; the others leave it alone.
struct CommandLine {
  Action action = Action::none;
  Client::Options host;
  UnpackOptions unpack;
  /// Of `stream`.
  String metrics;
  /// Of `describe`.
  Optional<String> name;
  DescribeForm form = DescribeForm::page;
  /// Of `--version`.
  Bool verbose = false;
  LogLevel logLevel = LogLevel::warning;
  Bool quiet = false;
};

/// `words` are without the command's own name. Throws nothing but std::bad_alloc.
CommandLine readCommandLine(Array<String> words, Console& console);

}  // namespace Keelgate::CLI
