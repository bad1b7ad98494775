// SPDX-License-Identifier: Apache-2.0
/// What a stranger may have written, on its way to somebody's terminal. Pure but for the last
/// function; callable from any thread.
#include "framework/client/log_line.h"

#include "text/utf8.h"

#include <poll.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <ctime>

namespace Keelgate {

namespace {

/// The length of the character at the front; 0 if there is none.
std::size_t characterLength(std::string_view text) noexcept {
  for (std::size_t n = 1; n <= 4 && n <= text.size(); ++n) {
    if (Text::isUtf8(text.substr(0, n))) return n;
  }
  return 0;
}

bool isControl(std::string_view character) noexcept {
  const auto first = static_cast<unsigned char>(character[0]);
  if (character.size() == 1) return first < 0x20 || first == 0x7f;
  // U+0080 to U+009F: a terminal may take these for escape sequences of one character.
  return first == 0xc2 && static_cast<unsigned char>(character[1]) < 0xa0;
}

void appendEscaped(String& to, std::string_view bytes) {
  constexpr const char* digits = "0123456789abcdef";
  for (const char c : bytes) {
    const auto byte = static_cast<unsigned char>(c);
    to += "\\x";
    to += digits[byte >> 4];
    to += digits[byte & 0xf];
  }
}

/// A line that nobody reads is dropped: a stranger's message must not end the application by
/// SIGPIPE, nor hold it at a pipe that is full. Two writers may still find the same last room in
/// it; an application that cannot have that gives a sink of its own.
void writeToStandardError(const String& text) noexcept {
  pollfd entry{.fd = STDERR_FILENO, .events = POLLOUT, .revents = 0};
  if (poll(&entry, 1, 0) != 1 || (entry.revents & POLLOUT) == 0) return;
  sigset_t pipe;
  sigset_t before;
  sigset_t pending;
  sigemptyset(&pipe);
  sigaddset(&pipe, SIGPIPE);
  sigpending(&pending);
  pthread_sigmask(SIG_BLOCK, &pipe, &before);
  const bool broken = write(STDERR_FILENO, text.data(), text.size()) < 0 && errno == EPIPE;
  // Only the one that this write made is taken away.
  constexpr timespec atOnce{};
  if (broken && sigismember(&pending, SIGPIPE) == 0) sigtimedwait(&pipe, nullptr, &atOnce);
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
}

}  // namespace

String escapeLogLine(std::string_view line) {
  String escaped;
  while (!line.empty()) {
    const std::size_t length = characterLength(line);
    const std::string_view character = line.substr(0, length == 0 ? 1 : length);
    if (length == 0 || isControl(character)) {
      appendEscaped(escaped, character);
    } else {
      escaped += character;
    }
    line.remove_prefix(character.size());
  }
  return escaped;
}

void logLine(const LogSink& sink, std::string_view line) {
  if (sink) {
    sink(line);
    return;
  }
  // One write for the whole line keeps lines of several threads apart.
  writeToStandardError(String(line) + '\n');
}

}  // namespace Keelgate
