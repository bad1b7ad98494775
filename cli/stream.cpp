// SPDX-License-Identifier: Apache-2.0
/// Requests from standard input, replies to standard output, any number in flight.
#include "cli/commands.h"
#include "cli/host.h"
#include "cli/metrics_file.h"
#include "cli/ordered_work.h"
#include "cli/request_input.h"
#include "cli/request_line.h"

#include <fmt/format.h>

#include <system_error>
#include <utility>
#include <variant>

namespace Keelgate::CLI {

namespace {

HostError faultOf(HostError::Reason reason, std::size_t largestMessage) {
  if (reason == HostError::Reason::messageTooLarge) {
    return {reason, fmt::format("the line is too long for a message of {} bytes", largestMessage)};
  }
  return {reason, "there is not enough memory for the line"};
}

/// The replies to some lines, one after the other. Runs on any of the threads.
class Replies {
 public:
  Replies(const Host& host, const RequestInput& input, Lines lines)
      : host_(host), input_(input), lines_(std::move(lines)) {}

  Optional<JSON::Reply> operator()() {
    const Optional<std::span<char>> line = lines_.next();
    if (!line) return std::nullopt;
    if (lines_.isGivenUp) {
      return JSON::requestError(
          fmt::format("the line has more than {} bytes, and not in \"message\"",
                      input_.longestLine()),
          {});
    }
    RequestLine request = readRequestLine(*line);
    JSON::Form form;
    if (request.id) form = {.prefaceKey = "id", .preface = std::move(*request.id)};
    if (const auto* problem = std::get_if<String>(&request.content)) {
      return JSON::requestError(*problem, form);
    }
    if (lines_.fault) {
      return JSON::givenUp(faultOf(*lines_.fault, host_.largestMessage()), form);
    }
    const auto& [subject, message, typed] = std::get<StreamRequest>(request.content);
    form.typed = typed;
    return host_.answer(subject, message, form);
  }

 private:
  const Host& host_;
  const RequestInput& input_;
  Lines lines_;
};

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
  RequestInput input(host.largestMessage(), host.threads());
  Delivery delivery(console, tally, Delivery::Kind::stream);
  OrderedWork work([&](const auto& due, Bool jobEnded) {
    return delivery.take(due) && (!(jobEnded || !input.isWaiting()) || console.flush());
  });
  work.run(host.threads(), [&]() -> Optional<OrderedWork::Job> {
    try {
      Optional<Lines> lines = input.take(work.endedDescriptor(), *file);
      if (!lines) return std::nullopt;
      const std::size_t weight = lines->text.size();
      return OrderedWork::Job{.next = Replies(host, input, std::move(*lines)), .weight = weight};
    } catch (const std::system_error& error) {
      console.note(Status::unusable);
      console.complain(fmt::format("standard input: {}", error.code().message()));
      return std::nullopt;
    }
  });
}

}  // namespace Keelgate::CLI
