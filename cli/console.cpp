// SPDX-License-Identifier: Apache-2.0
/// Everything that is said on standard error is escaped here, at the last moment, so that no caller
/// can forget it. Results are JSON or the program's own text, and are fit to be shown when they
/// come.
#include "cli/console.h"

#include "cli/files.h"
#include "framework/json/writer.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <csignal>
#include <cstdlib>
#include <limits>
#include <system_error>
#include <utility>

namespace Keelgate::CLI {

namespace {

/// In columns, of a terminal that does not say.
constexpr std::size_t usual = 80;

std::string_view variable(const char* name) {
  const char* value = std::getenv(name);
  return value == nullptr ? std::string_view() : std::string_view(value);
}

}  // namespace

Console::Console() {
  for (int standard : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (fcntl(standard, F_GETFD) >= 0) continue;
    // Opened the wrong way round, so that using it fails as it would have.
    open("/dev/null", standard == STDIN_FILENO ? O_WRONLY : O_RDONLY);
  }
  // Or a reader such as head, which has enough, would end this process in the middle of its work.
  std::signal(SIGPIPE, SIG_IGN);
}

Bool Console::print(std::string_view text) {
  if (text.size() > buffer_.size() - buffered_ && !flush()) return false;
  if (text.size() > buffer_.size()) return write(text);
  buffered_ += text.copy(buffer_.data() + buffered_, text.size());
  return true;
}

Bool Console::flush() {
  return buffered_ == 0 || write({buffer_.data(), std::exchange(buffered_, 0)});
}

Bool Console::write(std::string_view text) {
  clearProgress();
  try {
    return writeAll(STDOUT_FILENO, text);
  } catch (const std::system_error& error) {
    complain(fmt::format("standard output: {}", error.code().message()));
    note(Status::unusable);
    return false;
  }
}

void Console::complain(std::string_view sentence) {
  sayLine(fmt::format("keelgate: {}", JSON::withoutControls(sentence)));
}

void Console::log(LogLevel level, std::string_view line) {
  if (level <= logLevel_) sayLine(JSON::withoutControls(line));
}

void Console::remark(std::string_view sentence) {
  if (logLevel_ != LogLevel::quiet) sayLine(sentence);
}

void Console::sayLine(std::string_view line) {
  clearProgress();
  const std::lock_guard lock(mutex_);
  try {
    writeAll(STDERR_FILENO, fmt::format("{}\n", line));
  } catch (const std::system_error&) {
    // There is nowhere left to say it; the exit status still tells.
  }
}

void Console::progress(std::size_t done, std::size_t total) {
  if (logLevel_ == LogLevel::quiet || !isTerminal(STDERR_FILENO)) return;
  const std::lock_guard lock(mutex_);
  // Without a newline: the next thing that is said takes its place.
  const String line = fmt::format("\r{} of {} messages", done, total);
  // Best effort: what cannot be shown is not remembered as shown.
  progressShown_ = ::write(STDERR_FILENO, line.data(), line.size()) > 0;
}

void Console::clearProgress() {
  const std::lock_guard lock(mutex_);
  if (!progressShown_) return;
  constexpr std::string_view clear = "\r\033[K";
  // Where it could not be cleared it still stands there.
  progressShown_ = ::write(STDERR_FILENO, clear.data(), clear.size()) < 0;
}

void Console::note(Status status) {
  const std::lock_guard lock(mutex_);
  status_ = std::max(status_, status);
}

Status Console::status() const {
  const std::lock_guard lock(mutex_);
  return status_;
}

Bool isTerminal(int descriptor) {
  return isatty(descriptor) == 1;
}

std::size_t outputWidth() {
  constexpr std::size_t most = std::numeric_limits<std::size_t>::max();
  if (!isTerminal(STDOUT_FILENO)) return most;
  std::size_t wanted = 0;
  const std::string_view columns = variable("COLUMNS");
  std::from_chars(columns.data(), columns.data() + columns.size(), wanted);
  winsize window{};
  ioctl(STDOUT_FILENO, TIOCGWINSZ, &window);
  // A wider COLUMNS is what is left of another terminal.
  const std::size_t width =
      std::min(wanted == 0 ? most : wanted, window.ws_col == 0 ? most : window.ws_col);
  return width == most ? usual : width;
}

Bool outputHasColour() {
  // NO_COLOR counts unless it is empty, whatever stands in it.
  return isTerminal(STDOUT_FILENO) && variable("NO_COLOR").empty() && variable("TERM") != "dumb";
}

}  // namespace Keelgate::CLI
