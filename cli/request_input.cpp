// SPDX-License-Identifier: Apache-2.0
#include "cli/request_input.h"

#include "cli/files.h"

#include <poll.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <new>
#include <system_error>
#include <utility>

namespace Keelgate::CLI {

namespace {

constexpr std::size_t chunkSize = std::size_t{64} << 10;

/// What one thread takes, so that the others find some too.
constexpr std::size_t maximumLines = 16;

/// What a line may have beside its message: the service's identifier, an id.
constexpr std::size_t besideMessage = std::size_t{1} << 20;

/// True when there is input, or its end. False when no reply is wanted any more: a filter whose
/// result nobody takes must not wait for input that may never come.
Bool waitForInput(int ended, MetricsFile& metrics) {
  pollfd entries[] = {{.fd = STDIN_FILENO, .events = POLLIN, .revents = 0},
                      {.fd = ended, .events = POLLIN, .revents = 0},
                      {.fd = STDOUT_FILENO, .events = 0, .revents = 0}};
  for (int ready = 0; ready <= 0;) {
    metrics.update();
    ready = poll(entries, std::size(entries), metrics.interval());
    if (ready < 0 && errno != EINTR) throw std::system_error(errno, std::generic_category());
  }
  // POLLERR on the writing end of a pipe: its reader has gone.
  return entries[1].revents == 0 && (entries[2].revents & POLLERR) == 0;
}

/// All of the text but the white space at its end.
std::string_view trimmed(std::string_view text) {
  return text.substr(0, text.find_last_not_of(" \t\r") + 1);
}

/// By looking for each, which skips what lies between many characters at a time.
std::size_t newlinesIn(std::string_view text) {
  std::size_t count = 0;
  for (std::size_t at = 0; (at = text.find('\n', at)) != std::string_view::npos; ++at) ++count;
  return count;
}

}  // namespace

Optional<std::span<char>> Lines::next() {
  if (position >= text.size()) return std::nullopt;
  const std::size_t begin = position;
  const std::size_t end = std::min(text.find('\n', begin), text.size());
  position = end + 1;
  return std::span(text).subspan(begin, end - begin);
}

void AbridgedLine::add(std::string_view part) {
  for (const char c : part) add(c);
}

void AbridgedLine::add(char c) {
  if (isGivenUp_) return;
  if (inString_) {
    const Bool escaped = std::exchange(afterBackslash_, !afterBackslash_ && c == '\\');
    inString_ = escaped || c != '"';
    if (inString_ && omits_) return;
    omits_ = false;
  } else if (c == '"') {
    inString_ = true;
    string_ = text_.size() + 1;
  } else if (c == '{' || c == '[') {
    ++depth_;
  } else if (c == '}' || c == ']') {
    --depth_;
  }
  text_ += c;
  if (text_.size() <= besideMessage) return;
  omits_ = inString_ && isMessage();
  isGivenUp_ = !omits_;
  text_.resize(omits_ ? string_ : 0);
}

/// Whether the string that is open is the message of the request itself. A key that is spelt with
/// escapes is not looked for.
Bool AbridgedLine::isMessage() const {
  std::string_view before = trimmed(std::string_view(text_).substr(0, string_ - 1));
  if (depth_ != 1 || !before.ends_with(':')) return false;
  before.remove_suffix(1);
  return trimmed(before).ends_with("\"message\"");
}

Lines AbridgedLine::take() {
  return {.text = std::move(text_) + '\n', .fault = fault_, .isGivenUp = isGivenUp_};
}

/// Base64 takes four bytes for three; writers that escape each "/" take a little more.
RequestInput::RequestInput(std::size_t largestMessage, std::size_t threads)
    : longest_(besideMessage + largestMessage / 2 * 3),
      threads_(threads),
      chunk_(std::make_unique<char[]>(chunkSize)) {}

Optional<Lines> RequestInput::take(int ended, MetricsFile& metrics) {
  for (;;) {
    if (Optional<Lines> lines = cut()) return lines;
    if (!waitForInput(ended, metrics)) return std::nullopt;
    const std::size_t size = readSome(STDIN_FILENO, chunk_.get(), chunkSize);
    text_.erase(0, std::exchange(begin_, 0));
    if (size == 0) break;
    add({chunk_.get(), size});
  }
  // The last line may lack its newline.
  if (abridged_) return std::exchange(abridged_, std::nullopt)->take();
  if (text_.empty()) return std::nullopt;
  return Lines{.text = std::exchange(text_, {})};
}

Bool RequestInput::isWaiting() const {
  int size = 0;
  // Of a file too, which poll would call readable at its end.
  return hasLines_ || (ioctl(STDIN_FILENO, FIONREAD, &size) == 0 && size > 0);
}

Optional<Lines> RequestInput::cut() {
  if (whole_) return std::exchange(whole_, std::nullopt);
  const std::string_view rest = std::string_view(text_).substr(begin_);
  const std::size_t most = std::min(maximumLines, (waiting_ + threads_ - 1) / threads_);
  std::size_t end = 0;
  for (std::size_t taken = 0; taken < most && end < chunkSize; ++taken) {
    end = rest.find('\n', end) + 1;
    --waiting_;
  }
  hasLines_ = waiting_ > 0;
  if (end == 0) return std::nullopt;
  Lines lines;
  if (end == text_.size()) {
    lines.text = std::exchange(text_, {});
  } else {
    lines.text = rest.substr(0, end);
    begin_ += end;
  }
  return lines;
}

void RequestInput::add(std::string_view chunk) {
  // What some editors put in front of a file; it is not part of the JSON.
  if (std::exchange(isFirst_, false) && chunk.starts_with("\xef\xbb\xbf")) chunk.remove_prefix(3);
  // What was there has no newline, and a chunk has no line that is too long of itself.
  const std::size_t end = std::min(chunk.find('\n'), chunk.size());
  if (!abridged_ && end > longest_ - text_.size()) abridge(HostError::Reason::messageTooLarge);
  if (!abridged_) {
    try {
      text_ += chunk;
      waiting_ += newlinesIn(chunk);
      return;
    } catch (const std::bad_alloc&) {
      abridge(HostError::Reason::resourcesExhausted);
    }
  }
  abridged_->add(chunk.substr(0, end));
  if (end == chunk.size()) return;
  whole_ = std::exchange(abridged_, std::nullopt)->take();
  text_ = chunk.substr(end + 1);
  waiting_ = newlinesIn(text_);
}

void RequestInput::abridge(HostError::Reason why) {
  abridged_.emplace(why);
  // What is not going to be unpacked is not kept either.
  abridged_->add(std::exchange(text_, {}));
}

}  // namespace Keelgate::CLI
