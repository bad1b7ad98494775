// SPDX-License-Identifier: Apache-2.0
/// Requests from standard input, replies to standard output, any number in flight.
#include "cli/commands.h"
#include "cli/files.h"
#include "cli/host.h"
#include "cli/ordered_work.h"
#include "cli/request_line.h"

#include <fmt/format.h>
#include <unistd.h>

#include <system_error>
#include <utility>

namespace Keelgate::CLI {

namespace {

/// The whole way of a line: runs on any of the threads.
Reply answerLine(Client& client, std::string_view line) {
  const RequestLine request = readRequestLine(line);
  Preface preface;
  if (request.id) preface = {.key = "id", .value = *request.id};
  if (const auto* problem = std::get_if<String>(&request.content)) {
    return requestError(*problem, preface);
  }
  const auto& [subject, message] = std::get<Request>(request.content);
  return answer(client, subject, message, preface, Layout::compact);
}

}  // namespace

void stream(Client::Options options, Console& console) {
  const std::size_t threads = threadsFor(options);
  options.processes = static_cast<unsigned>(threads);
  Client client(loggingTo(console, std::move(options)));
  OrderedWork work(threads, [&](const Reply& reply) {
    // A rejected message is a normal answer here.
    if (reply.verdict != Verdict::rejected) console.note(statusOf(reply.verdict));
    // The reply still goes out, then work ends: there is no service for what follows.
    const Bool lost = reply.verdict == Verdict::serviceLost;
    if (lost) console.complain(reply.problem);
    return console.print(reply.json) && !lost;
  });
  // This thread only cuts lines; they are parsed where they are answered, several at a time.
  LineReader lines(STDIN_FILENO, STDOUT_FILENO, work.endedDescriptor());
  try {
    while (Optional<String> line = lines.next()) {
      const std::size_t weight = line->size();
      auto job = [&client, text = std::move(*line)] {
        return answerLine(client, text);
      };
      if (!work.add(std::move(job), weight)) break;
    }
  } catch (const std::system_error& error) {
    console.note(Status::unusable);
    console.complain(fmt::format("standard input: {}", error.code().message()));
  }
  work.finish();
}

}  // namespace Keelgate::CLI
