// SPDX-License-Identifier: Apache-2.0
/// Files are read where they are unpacked, so no more of them are in memory than there are threads.
#include "cli/commands.h"
#include "cli/files.h"
#include "cli/host.h"
#include "cli/ordered_work.h"

#include <fmt/format.h>

#include <algorithm>
#include <system_error>

namespace Keelgate::CLI {

namespace {

constexpr std::string_view standardInput = "-";

/// The files of one call, each unpacked in the same way. Unpacking is for many threads at once.
class Batch {
 public:
  Batch(Client& client, const UnpackOptions& what, std::size_t largestMessage)
      : client_(client), what_(what), largestMessage_(largestMessage) {}

  [[nodiscard]] Reply unpackFile(const String& path) const {
    Reply reply;
    try {
      reply = replyTo(path);
    } catch (const std::system_error& error) {
      reply = {.json = {}, .verdict = Verdict::unusable, .problem = error.code().message()};
    }
    if (!reply.problem.empty()) {
      const String name = path == standardInput ? "standard input" : path;
      reply.problem = fmt::format("{}: {}", name, reply.problem);
    }
    return reply;
  }

 private:
  [[nodiscard]] Reply replyTo(const String& path) const {
    // A file without end is read no further than it takes to see that it is too large.
    const Data message = readFile(path, largestMessage_ + 1);
    if (message.size() <= largestMessage_) {
      return answer(client_, what_.subject, message, prefaceOf(path), what_.layout);
    }
    const HostError tooLarge(HostError::Reason::messageTooLarge,
                             fmt::format("more than {} bytes", largestMessage_));
    return givenUp(tooLarge, prefaceOf(path), what_.layout);
  }

  [[nodiscard]] Preface prefaceOf(const String& path) const {
    if (what_.files.size() < 2) return {};
    return {.key = "file", .value = jsonString(path)};
  }

  Client& client_;
  const UnpackOptions& what_;
  std::size_t largestMessage_;
};

}  // namespace

void unpack(Client::Options options, const UnpackOptions& what, Console& console) {
  const std::size_t total = what.files.size();
  const std::size_t threads = std::min(threadsFor(options), total);
  // No more processes than messages: the others would be started for nothing.
  options.processes = static_cast<unsigned>(threads);
  const std::size_t largestMessage = options.largestMessage;
  Client client(loggingTo(console, std::move(options)));
  const Batch batch(client, what, largestMessage);

  std::size_t done = 0;
  OrderedWork work(threads, [&](const Reply& reply) {
    ++done;
    console.note(statusOf(reply.verdict));
    // The object before the sentence: at a terminal the sentence comments on it.
    if (!console.print(reply.json)) return false;
    if (!reply.problem.empty()) console.complain(reply.problem);
    if (done < total) console.progress(done, total);
    return reply.verdict != Verdict::serviceLost;
  });
  for (const String& path : what.files) {
    if (!work.add([&batch, &path] { return batch.unpackFile(path); }, 0)) break;
  }
  work.finish();
  if (console.status() == Status::serviceLost && done < total) {
    console.complain(fmt::format("{} of {} messages were not unpacked", total - done, total));
  }
}

}  // namespace Keelgate::CLI
