// SPDX-License-Identifier: Apache-2.0
/// Where the command's words go: results to standard output, everything else to standard error.
#pragma once

#include "framework/json/reply.h"

#include <keelgate/values.h>

#include <array>
#include <cstddef>
#include <mutex>
#include <string_view>

namespace Keelgate::CLI {

using JSON::Status;

/// What is said beside errors, each with what stands before it.
enum class LogLevel : std::uint8_t {
  /// No progress and no sum-up either.
  quiet,
  none,
  /// What the service logs.
  error,
  /// What the host has to say of the system.
  warning,
};

/// Where nothing else is said, members may be called from many threads at once.
class Console {
 public:
  /// Makes sure that the three standard descriptors are taken, so that no file of ours becomes one,
  /// and that a reader that goes away is an error and not a signal.
  Console();

  /// Prints a part of a result, at the latest with the next `flush`. For one thread at a time.
  /// False when nobody reads it any more, which is not a fault, or when it could not be written,
  /// which is said and remembered.
  Bool print(std::string_view text);
  Bool flush();

  /// One sentence about what went wrong. Untrusted parts may stand in it: characters that drive a
  /// terminal are escaped.
  void complain(std::string_view sentence);

  /// A line of a log.
  void log(LogLevel level, std::string_view line);
  /// A sentence about the run as a whole.
  void remark(std::string_view sentence);
  /// Before anything else is said.
  void setLogLevel(LogLevel level) { logLevel_ = level; }

  /// Says how far the work is, at a terminal alone, over what it said before.
  void progress(std::size_t done, std::size_t total);

  /// Notes an exit status, and gives the worst that was noted.
  void note(Status status);
  [[nodiscard]] Status status() const;

 private:
  Bool write(std::string_view text);
  void sayLine(std::string_view line);
  void clearProgress();

  /// What is printed and not written yet. Never grows, so that printing needs no memory.
  std::array<char, std::size_t{64} << 10> buffer_;
  std::size_t buffered_ = 0;
  LogLevel logLevel_ = LogLevel::warning;

  /// Guards the two below, and keeps lines on standard error whole.
  mutable std::mutex mutex_;
  Status status_ = Status::done;
  Bool progressShown_ = false;
};

Bool isTerminal(int descriptor);

/// In columns: of the terminal at standard output, or what COLUMNS says where that is less; without
/// a terminal as many as there can be.
std::size_t outputWidth();

/// Whether headings may stand out: at a terminal that can, unless NO_COLOR is set.
Bool outputHasColour();

}  // namespace Keelgate::CLI
