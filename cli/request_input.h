// SPDX-License-Identifier: Apache-2.0
/// Standard input as the lines of `keelgate stream`, a few at a time.
#pragma once

#include "cli/metrics_file.h"

#include <keelgate/errors.h>
#include <keelgate/values.h>

#include <atomic>
#include <cstddef>
#include <memory>
#include <span>
#include <string_view>

namespace Keelgate::CLI {

/// Some lines that follow one another, in memory of their own.
struct Lines {
  String text;
  /// Why the only line is not all there: its message is left out, or the line was given up.
  Optional<HostError::Reason> fault = {};
  Bool isGivenUp = false;
  std::size_t position = 0;

  /// The next one, without its newline.
  Optional<std::span<char>> next();
};

/// What is kept of a line that is too long: all but its message, since the id may stand behind it.
class AbridgedLine {
 public:
  explicit AbridgedLine(HostError::Reason why) : fault_(why) {}

  void add(std::string_view part);
  Lines take();

 private:
  void add(char c);
  [[nodiscard]] Bool isMessage() const;

  HostError::Reason fault_;
  String text_;
  std::size_t depth_ = 0;
  Bool inString_ = false;
  Bool afterBackslash_ = false;
  /// Where the string began that is open, in `text_`; and whether it is left out.
  std::size_t string_ = 0;
  Bool omits_ = false;
  Bool isGivenUp_ = false;
};

class RequestInput {
 public:
  /// For messages of so many bytes at most, and so many threads that share the lines.
  RequestInput(std::size_t largestMessage, std::size_t threads);

  /// In bytes, of a line that is kept whole.
  [[nodiscard]] std::size_t longestLine() const { return longest_; }

  /// The lines that are there, or a part of them when other threads can do the others; waits for
  /// one. Nothing at the end, and when `ended` becomes readable or nobody reads the output any
  /// more. One thread at a time. Throws std::system_error, std::bad_alloc.
  Optional<Lines> take(int ended, MetricsFile& metrics);

  /// Whether there is more to take. From any thread.
  [[nodiscard]] Bool isWaiting() const;

 private:
  Optional<Lines> cut();
  void add(std::string_view chunk);
  void abridge(HostError::Reason why);

  const std::size_t longest_;
  const std::size_t threads_;
  const std::unique_ptr<char[]> chunk_;
  /// What has not been taken, from `begin_` on.
  String text_;
  std::size_t begin_ = 0;
  /// How many newlines there are in it: so that no byte of a long line is looked at twice.
  std::size_t waiting_ = 0;
  std::atomic<bool> hasLines_ = false;
  Bool isFirst_ = true;
  /// The line that is read now, if it is too long, and the one before `text_`.
  Optional<AbridgedLine> abridged_;
  Optional<Lines> whole_;
};

}  // namespace Keelgate::CLI
