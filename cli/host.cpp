// SPDX-License-Identifier: Apache-2.0
#include "cli/host.h"

#include "cli/commands.h"
#include "framework/client/pool.h"

#include <fmt/format.h>

#include <algorithm>
#include <new>
#include <utility>

namespace Keelgate::CLI {

namespace {

Client::Options completed(Client::Options options, Console& console, std::size_t maximumMessages) {
  options.log = [&console](std::string_view line) {
    console.log(line.starts_with("keelgate: ") ? LogLevel::warning : LogLevel::error, line);
  };
  // Deliberate: whoever made a message fail does not wait for the answer himself, but all those
  // whose answers come behind it do.
  options.abnormalEndsPerSecond = 0;
  options.largestMessage = std::min(options.largestMessage, Client::Options::maximumMessageSize);
  // No more processes than messages: the others would be started for nothing.
  options.processes = static_cast<unsigned>(std::min(processesFor(options), maximumMessages));
  return options;
}

}  // namespace

Host::Host(Client::Options options, Console& console, std::size_t maximumMessages)
    : options_(completed(std::move(options), console, maximumMessages)), client_(options_) {}

JSON::Reply Host::answer(const JSON::Subject& subject, Bytes message,
                         const JSON::Form& form) const {
  return JSON::answer(client_, options_.timeLimit, subject, message, form);
}

Bool Delivery::take(const std::vector<JSON::Reply>& due) noexcept {
  Bool goOn = true;
  try {
    for (const JSON::Reply& reply : due) {
      ++taken_;
      tally_.count(reply);
      for (const String& piece : reply.json) goOn = goOn && console_.print(piece);
      say(reply);
      goOn = goOn && reply.status != Status::serviceLost;
      if (!goOn) break;
    }
  } catch (const std::bad_alloc&) {
    console_.note(Status::serviceLost);
    return false;
  }
  return goOn;
}

void Delivery::say(const JSON::Reply& reply) {
  const Bool lost = reply.status == Status::serviceLost;
  // In a stream a reply says it all, and a rejected message is a normal one.
  if (kind_ == Kind::files || reply.status != Status::rejected) {
    console_.note(reply.status);
  }
  if (!reply.problem.empty() && (kind_ == Kind::files || lost)) {
    // The object before the sentence: at a terminal the sentence comments on it.
    console_.flush();
    console_.complain(reply.problem);
  }
  if (taken_ < total_) console_.progress(taken_, total_);
}

void reportVersions(std::string_view version, const Client::Options& options, Console& console) {
  const ServiceReport report = Host(options, console).report();
  String text =
      fmt::format("keelgate {}\nservice  {}\n\nSandbox layers:\n", version, report.version);
  for (const SandboxLayer& layer : report.layers) {
    text += fmt::format("  {:<30}{}\n", layer.name, layer.present ? "present" : "MISSING");
  }
  console.print(text);
}

}  // namespace Keelgate::CLI
