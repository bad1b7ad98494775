// SPDX-License-Identifier: Apache-2.0
/// The log of the service: one handle, one level.
#pragma once

#include <keelgate/values.h>

#include <concepts>
#include <string>
#include <string_view>

namespace Keelgate {

/// A handle logs from any thread. A line goes to the capture of the calling thread, or to standard
/// error where there is none. There is one level, because a service that decodes strangers'
/// messages has nothing to say but that one was refused.
class LogHandle {
 public:
  /// At error level. `format` holds "%@" once, which `argument` takes the place of.
  void error(std::string_view format, std::string_view argument) const;
};

namespace Log {
/// The handle of the framework; no other is made.
inline constexpr LogHandle keelgate;
}  // namespace Log

/// Takes the lines that are logged on this thread for as long as it lives: a sealed worker has no
/// standard error, so that its lines travel with its reply. One at a time on a thread.
class LogCapture {
 public:
  LogCapture();
  ~LogCapture();
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  /// In the order of logging. As many as were logged; the sender of the reply bounds them.
  Array<String> lines;
};

/// Renders an optional number for a log line.
template <std::integral T>
String rendered(const Optional<T>& value) {
  return value ? std::to_string(*value) : "nil";
}

}  // namespace Keelgate
