// SPDX-License-Identifier: Apache-2.0
/// Reading and writing descriptors: whole messages, lines, and text to a pipe whose other end may
/// be gone.
#pragma once

#include <keelgate/values.h>

#include <cstddef>
#include <string_view>
#include <utility>

namespace Keelgate::CLI {

/// Writes all of `text`, waiting as long as it takes. False when the reader is gone; throws
/// std::system_error on any other failure. Expects SIGPIPE to be ignored.
Bool writeAll(int descriptor, std::string_view text);

/// The file at `path`, or standard input for "-", but never more than `limit` bytes of it. Throws
/// std::system_error.
Data readFile(const String& path, std::size_t limit);

/// Lines of any length from a descriptor that it does not own. For one thread.
class LineReader {
 public:
  /// The input ends also as soon as `ended` becomes readable, or `output` has lost its reader: a
  /// filter whose result nobody takes must not wait for input that may never come.
  LineReader(int input, int output, int ended) : input_(input), output_(output), ended_(ended) {}

  /// The next line without its newline; a last line may lack one. Nothing at the end. Throws
  /// std::system_error.
  Optional<String> next();

 private:
  Bool fill();
  Bool wait() const;

  int input_;
  int output_;
  int ended_;
  String buffer_;
  /// Where the next line begins, and up to where it has been searched for its end.
  std::size_t begin_ = 0;
  std::size_t searched_ = 0;
};

}  // namespace Keelgate::CLI
