// SPDX-License-Identifier: Apache-2.0
/// Plain descriptors and no streams: an error has to keep its reason.
#include "cli/files.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <new>
#include <system_error>

namespace Keelgate::CLI {

namespace {

/// What a pipe holds on Linux, so a full one is taken in one piece.
constexpr std::size_t chunk = std::size_t{64} << 10;

[[noreturn]] void fail() {
  throw std::system_error(errno, std::generic_category());
}

void waitFor(int descriptor, short events) {
  pollfd entry{.fd = descriptor, .events = events, .revents = 0};
  if (poll(&entry, 1, -1) < 0 && errno != EINTR) fail();
}

/// Closes what it opened, and leaves standard input open.
class Input {
 public:
  explicit Input(const String& path)
      : descriptor_(path == "-" ? STDIN_FILENO
                                : open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY)) {
    if (descriptor_ < 0) fail();
  }
  ~Input() {
    if (descriptor_ != STDIN_FILENO) close(descriptor_);
  }
  Input(const Input&) = delete;
  Input& operator=(const Input&) = delete;

  [[nodiscard]] int descriptor() const { return descriptor_; }

  /// In bytes; 0 where it cannot be known, as of a pipe. To save growing, and not relied on.
  [[nodiscard]] std::size_t expectedSize() const {
    struct stat status {};
    if (fstat(descriptor_, &status) != 0) fail();
    return S_ISREG(status.st_mode) ? static_cast<std::size_t>(status.st_size) : 0;
  }

 private:
  int descriptor_;
};

}  // namespace

Bool writeAll(int descriptor, std::string_view text) {
  while (!text.empty()) {
    const ssize_t n = write(descriptor, text.data(), text.size());
    if (n >= 0) {
      text.remove_prefix(static_cast<std::size_t>(n));
    } else if (errno == EPIPE) {
      // The reader has had enough: no fault, and nobody to tell.
      return false;
    } else if (errno == EAGAIN) {
      waitFor(descriptor, POLLOUT);
    } else if (errno != EINTR) {
      fail();
    }
  }
  return true;
}

std::size_t readSome(int descriptor, void* to, std::size_t size) {
  for (;;) {
    const ssize_t n = read(descriptor, to, size);
    if (n >= 0) return static_cast<std::size_t>(n);
    if (errno == EAGAIN) {
      waitFor(descriptor, POLLIN);
    } else if (errno != EINTR) {
      fail();
    }
  }
}

FileContent::FileContent(const String& path, std::size_t limit) {
  const Input input(path);
  // One more than its size, so that its end is seen without growing.
  std::size_t room = std::min(limit, std::max(chunk, input.expectedSize() + 1));
  resize(room);
  // Not read beyond the limit: an endless device must not fill the memory.
  while (size_ < limit) {
    if (size_ == room) resize(room = std::min(limit, 2 * room));
    const std::size_t n = readSome(input.descriptor(), bytes_.get() + size_, room - size_);
    if (n == 0) return;
    size_ += n;
  }
}

void FileContent::resize(std::size_t room) {
  void* grown = std::realloc(bytes_.get(), room);
  if (grown == nullptr) throw std::bad_alloc();
  static_cast<void>(bytes_.release());
  bytes_.reset(static_cast<std::byte*>(grown));
}

}  // namespace Keelgate::CLI
