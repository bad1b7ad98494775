// SPDX-License-Identifier: Apache-2.0
/// Files are read where they are unpacked, so no more of them are in memory than there are threads.
#include "cli/commands.h"
#include "cli/files.h"
#include "cli/host.h"
#include "cli/ordered_work.h"

#include <fmt/format.h>

#include <system_error>
#include <utility>

namespace Keelgate::CLI {

namespace {

constexpr std::string_view standardInput = "-";

JSON::Reply replyTo(const Host& host, const UnpackOptions& what, const String& path) {
  JSON::Form form{.layout = what.layout, .typed = what.typed};
  if (what.files.size() > 1) {
    form.prefaceKey = "file";
    form.preface = JSON::quote(path);
  }
  // A file without end is read no further than it takes to see that it is too large.
  const FileContent message(path, host.largestMessage() + 1);
  if (message.bytes().size() <= host.largestMessage()) {
    return host.answer(what.subject, message.bytes(), form);
  }
  const HostError tooLarge(HostError::Reason::messageTooLarge,
                           fmt::format("more than {} bytes", host.largestMessage()));
  return JSON::givenUp(tooLarge, form);
}

JSON::Reply unpackFile(const Host& host, const UnpackOptions& what, const String& path) {
  JSON::Reply reply;
  try {
    reply = replyTo(host, what, path);
  } catch (const std::system_error& error) {
    reply = {.status = Status::unusable, .problem = error.code().message()};
  }
  if (!reply.problem.empty()) {
    reply.problem =
        fmt::format("{}: {}", path == standardInput ? "standard input" : path, reply.problem);
  }
  return reply;
}

}  // namespace

void unpack(const Client::Options& options, const UnpackOptions& what, Console& console) {
  const std::size_t total = what.files.size();
  const Host host(options, console, total);
  Tally tally;
  Delivery delivery(console, tally, Delivery::Kind::files, total);
  OrderedWork work([&](const auto& due, Bool) { return delivery.take(due) && console.flush(); });
  work.run(host.threads(), [&, next = what.files.begin()]() mutable -> Optional<OrderedWork::Job> {
    if (next == what.files.end()) return std::nullopt;
    return OrderedWork::Job{.next = [&, path = &*next++, isDone = false]() mutable {
      return std::exchange(isDone, true) ? Optional<JSON::Reply>() : unpackFile(host, what, *path);
    }};
  });
  if (console.status() == Status::serviceLost && delivery.taken() < total) {
    console.complain(
        fmt::format("{} of {} messages were not unpacked", total - delivery.taken(), total));
  }
  if (total > 1) console.remark(tally.sentence());
}

}  // namespace Keelgate::CLI
