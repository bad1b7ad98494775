// SPDX-License-Identifier: Apache-2.0
/// The worker: the process that reads a stranger's message. It is thrown away afterwards.
#pragma once

#include "framework/server/keelgate_server.h"

#include <linux/filter.h>
#include <sys/types.h>
#include <cstdint>
#include <vector>

namespace Keelgate {

/// What a worker is told: by the client's hello and its fork, and by the zygote. Filled in by the
/// zygote and inherited by the fork, so a worker asks nobody for anything.
struct WorkerOptions {
  /// How many it may be given before it exits.
  std::uint64_t messages;
  std::uint64_t cpuSeconds;
  /// The zygote, as it sees itself: a worker whose parent is another has lost it already.
  pid_t parent;
  /// Built and tried by the zygote; loading it is all that is left to do.
  std::vector<sock_filter> filter;
  /// Bytes.
  std::uint64_t longestMessage;
};

/// Seals the process, answers as many messages as it may on `channel`, and exits. Called in a fresh
/// fork of the zygote.
[[noreturn]] void work(const KeelgateServer& server, const WorkerOptions& options, int channel);

}  // namespace Keelgate
