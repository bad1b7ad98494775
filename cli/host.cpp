// SPDX-License-Identifier: Apache-2.0
#include "cli/host.h"

#include "cli/commands.h"

#include <fmt/format.h>

#include <algorithm>
#include <thread>
#include <utility>

namespace Keelgate::CLI {

Client::Options loggingTo(Console& console, Client::Options options) {
  options.log = [&console](std::string_view line) {
    console.log(line);
  };
  return options;
}

std::size_t threadsFor(const Client::Options& options) {
  if (options.processes > 0) return options.processes;
  return std::max(1U, std::thread::hardware_concurrency());
}

Status statusOf(Verdict verdict) {
  switch (verdict) {
    case Verdict::record:
      return Status::done;
    case Verdict::rejected:
      return Status::rejected;
    case Verdict::unusable:
      return Status::unusable;
    case Verdict::serviceLost:
      break;
  }
  // Also for a verdict that is none, which only a cast can make: the worst is the safest.
  return Status::serviceLost;
}

void reportVersions(std::string_view version, const Client::Options& options, Console& console) {
  Client client(loggingTo(console, options));
  const ServiceReport report = client.report();
  String text =
      fmt::format("keelgate {}\nservice  {}\n\nSandbox layers:\n", version, report.version);
  for (const SandboxLayer& layer : report.layers) {
    text += fmt::format("  {:<30}{}\n", layer.name, layer.present ? "present" : "MISSING");
  }
  console.print(text);
}

}  // namespace Keelgate::CLI
