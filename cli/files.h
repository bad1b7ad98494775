// SPDX-License-Identifier: Apache-2.0
/// Reading and writing descriptors: whole messages, and text to a pipe whose other end may be gone.
#pragma once

#include <keelgate/values.h>

#include <cstddef>
#include <cstdlib>
#include <memory>
#include <string_view>

namespace Keelgate::CLI {

/// Writes all of `text`, waiting as long as it takes. False when the reader is gone; throws
/// std::system_error on any other failure. Expects SIGPIPE to be ignored.
Bool writeAll(int descriptor, std::string_view text);

/// At least one byte, or 0 at the end. Waits for descriptors that somebody else made non-blocking.
/// Throws std::system_error.
std::size_t readSome(int descriptor, void* to, std::size_t size);

/// What a file holds, in no more memory than that: it grows by moving pages, not bytes.
class FileContent {
 public:
  /// Reads the file at `path`, or standard input for "-", but never more than `limit` bytes.
  /// Throws std::system_error and std::bad_alloc.
  FileContent(const String& path, std::size_t limit);

  [[nodiscard]] Bytes bytes() const { return {bytes_.get(), size_}; }

 private:
  void resize(std::size_t room);

  struct Free {
    void operator()(std::byte* bytes) const { std::free(bytes); }
  };
  std::unique_ptr<std::byte, Free> bytes_;
  std::size_t size_ = 0;
};

}  // namespace Keelgate::CLI
