// SPDX-License-Identifier: Apache-2.0
/// Requests from standard input, replies to standard output, any number in flight.
#include "cli/commands.h"
#include "cli/files.h"
#include "cli/host.h"
#include "cli/metrics_file.h"
#include "cli/ordered_work.h"
#include "cli/request_line.h"

#include <fmt/format.h>

#include <poll.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <new>
#include <system_error>
#include <utility>
#include <variant>

namespace Keelgate::CLI {

namespace {

constexpr std::size_t chunkSize = std::size_t{64} << 10;

/// What a line may have beside its message: the service's identifier, an id.
constexpr std::size_t besideMessage = std::size_t{1} << 20;

/// Base64 takes four bytes for three; writers that escape each "/" take a little more.
std::size_t longestLine(std::size_t largestMessage) {
  return besideMessage + largestMessage / 2 * 3;
}

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

/// A line of input, or why it could not be kept.
using Line = std::variant<String, HostError::Reason>;

/// Cuts standard input into lines, the last of which may lack its newline.
class Lines {
 public:
  explicit Lines(std::size_t longest) : longest_(longest) {}

  /// Calls `use(line)` for each until it gives false or `ended` becomes readable. Throws
  /// std::system_error.
  template <class Use>
  void each(int ended, MetricsFile& metrics, const Use& use) {
    const auto chunk = std::make_unique<char[]>(chunkSize);
    while (waitForInput(ended, metrics)) {
      std::string_view text(chunk.get(), readSome(STDIN_FILENO, chunk.get(), chunkSize));
      if (text.empty()) {
        if (begun_) use(takeLine());
        return;
      }
      for (std::size_t end; (end = text.find('\n')) != std::string_view::npos;) {
        append(text.substr(0, end));
        text.remove_prefix(end + 1);
        if (!use(takeLine())) return;
      }
      if (!text.empty()) append(text);
    }
  }

 private:
  void append(std::string_view part) {
    begun_ = true;
    if (fault_) return;
    try {
      if (part.size() <= longest_ - line_.size()) {
        line_ += part;
        return;
      }
      fault_ = HostError::Reason::messageTooLarge;
    } catch (const std::bad_alloc&) {
      fault_ = HostError::Reason::resourcesExhausted;
    }
    // What is not going to be read is not kept either.
    line_ = String();
  }

  Line takeLine() {
    begun_ = false;
    if (const auto fault = std::exchange(fault_, std::nullopt)) return *fault;
    String line = std::exchange(line_, {});
    // What some editors put in front of a file; it is not part of the JSON.
    if (std::exchange(first_, false) && line.starts_with("\xef\xbb\xbf")) line.erase(0, 3);
    return line;
  }

  const std::size_t longest_;
  String line_;
  Optional<HostError::Reason> fault_;
  Bool begun_ = false;
  Bool first_ = true;
};

/// The whole way of a line: runs on any of the threads.
JSON::Reply answerLine(const Host& host, Line& line) {
  if (const auto* fault = std::get_if<HostError::Reason>(&line)) {
    if (*fault == HostError::Reason::resourcesExhausted) {
      return JSON::givenUp(HostError(*fault, "there is not enough memory for the line"), {});
    }
    return JSON::requestError(
        fmt::format("the line has more than {} bytes", longestLine(host.largestMessage())), {});
  }
  RequestLine request = readRequestLine(std::get<String>(line));
  JSON::Form form;
  if (request.id) form = {.prefaceKey = "id", .preface = std::move(*request.id)};
  if (const auto* problem = std::get_if<String>(&request.content)) {
    return JSON::requestError(*problem, form);
  }
  const auto& [subject, message, typed] = std::get<Request>(request.content);
  form.typed = typed;
  return host.answer(subject, message, form);
}

}  // namespace

void stream(const Client::Options& options, const String& metrics, Console& console) {
  Tally tally;
  Optional<MetricsFile> file;
  try {
    file.emplace(metrics, tally, console);
  } catch (const std::system_error& error) {
    console.note(Status::unusable);
    return console.complain(fmt::format("--metrics: {}", error.what()));
  }
  const Host host(options, console);
  Delivery delivery(console, tally, Delivery::Kind::stream);
  OrderedWork work(host.threads(), [&](const auto& due) { return delivery.take(due); });
  try {
    // This thread only cuts lines; they are parsed where they are answered, several at a time.
    Lines(longestLine(host.largestMessage())).each(work.endedDescriptor(), *file, [&](Line line) {
      const auto* text = std::get_if<String>(&line);
      const std::size_t weight = text == nullptr ? 0 : text->size();
      return work.add([&host, line = std::move(line)]() mutable { return answerLine(host, line); },
                      weight);
    });
  } catch (const std::system_error& error) {
    console.note(Status::unusable);
    console.complain(fmt::format("standard input: {}", error.code().message()));
  }
  work.finish();
}

}  // namespace Keelgate::CLI
