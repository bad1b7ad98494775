// SPDX-License-Identifier: Apache-2.0
/// Plain descriptors and no streams: a pipe has to be waited for together with others, and an error
/// has to keep its reason.
#include "cli/files.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
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

/// At least one byte, or 0 at the end. Descriptors that somebody else made non-blocking are waited
/// for.
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

Data readFile(const String& path, std::size_t limit) {
  const Input input(path);
  struct stat status {};
  if (fstat(input.descriptor(), &status) != 0) fail();

  // A file's own idea of its size saves growing, and is not relied on.
  std::size_t room = chunk;
  // One more than its size, so that its end is seen without growing.
  if (S_ISREG(status.st_mode)) room = static_cast<std::size_t>(status.st_size) + 1;
  Data bytes;
  for (;;) {
    const std::size_t size = bytes.size();
    // Not read any further: an endless device must not fill the memory.
    if (size == limit) return bytes;
    bytes.resize(size + std::min(room, limit - size));
    const std::size_t n = readSome(input.descriptor(), bytes.data() + size, bytes.size() - size);
    bytes.resize(size + n);
    if (n == 0) return bytes;
    room = std::max(chunk, bytes.size());
  }
}

Optional<String> LineReader::next() {
  for (;;) {
    // Only what is new is searched, or a long line in small pieces would take quadratic time.
    const std::size_t end = buffer_.find('\n', searched_);
    if (end != String::npos) {
      String line = buffer_.substr(begin_, end - begin_);
      begin_ = searched_ = end + 1;
      return line;
    }
    searched_ = buffer_.size();
    if (fill()) continue;
    if (begin_ == buffer_.size()) return std::nullopt;
    String line = buffer_.substr(begin_);
    begin_ = buffer_.size();
    return line;
  }
}

Bool LineReader::fill() {
  buffer_.erase(0, begin_);
  searched_ -= begin_;
  begin_ = 0;
  // A line that was much longer than others shall not stay in memory.
  if (buffer_.empty() && buffer_.capacity() > 16 * chunk) buffer_.shrink_to_fit();
  // Half a line that nobody wants an answer to is no line.
  if (!wait()) {
    buffer_.clear();
    searched_ = 0;
    return false;
  }
  const std::size_t size = buffer_.size();
  buffer_.resize(size + chunk);
  const std::size_t n = readSome(input_, buffer_.data() + size, chunk);
  buffer_.resize(size + n);
  return n > 0;
}

/// True when there is input, or its end. False when no reply is wanted any more.
Bool LineReader::wait() const {
  pollfd entries[] = {{.fd = input_, .events = POLLIN, .revents = 0},
                      {.fd = ended_, .events = POLLIN, .revents = 0},
                      {.fd = output_, .events = 0, .revents = 0}};
  for (;;) {
    if (poll(entries, std::size(entries), -1) < 0) {
      if (errno == EINTR) continue;
      fail();
    }
    // POLLERR on the writing end of a pipe: its reader has gone.
    if (entries[1].revents != 0 || (entries[2].revents & POLLERR) != 0) return false;
    if (entries[0].revents != 0) return true;
  }
}

}  // namespace Keelgate::CLI
