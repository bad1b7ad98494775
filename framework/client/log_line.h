// SPDX-License-Identifier: Apache-2.0
/// Log lines of a worker, made fit to be shown.
#pragma once

#include <keelgate/values.h>

#include <functional>
#include <string_view>

namespace Keelgate {

/// Where lines go. An empty one stands for standard error.
using LogSink = std::function<void(std::string_view line)>;

/// The line with every control character, and every byte that is not UTF-8, as \xNN. A taken-over
/// worker that could send an escape sequence to a terminal would get to write what it likes there,
/// and with some terminals to type it; one that could send a line feed would forge lines.
String escapeLogLine(std::string_view line);

/// Hands one finished line to the sink. Lines of several threads don't mix.
void logLine(const LogSink& sink, std::string_view line);

}  // namespace Keelgate
