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

bool isControl(char32_t c) noexcept {
  // U+0080 to U+009F: a terminal may take these for escape sequences of one character.
  return c < 0x20 || (c >= 0x7f && c < 0xa0);
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
  if (poll(&entry, 1, 0) != 1) return;
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
    // A byte that is not UTF-8 counts as a control character, 0.
    const auto [codePoint, length] = Text::firstCharacter(line);
    const std::string_view bytes = line.substr(0, length == 0 ? 1 : length);
    if (isControl(codePoint)) {
      appendEscaped(escaped, bytes);
    } else {
      escaped += bytes;
    }
    line.remove_prefix(bytes.size());
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
