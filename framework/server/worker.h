// SPDX-License-Identifier: Apache-2.0
/// The worker: the process that reads a stranger's message. It is thrown away afterwards.
#pragma once

#include "framework/server/keelgate_server.h"

#include <linux/filter.h>
#include <sys/types.h>
#include <cstdint>
#include <vector>

namespace Keelgate {

/// What a worker is told: by the client's hello and its fork, and by the zygote.
struct WorkerOptions {
  std::uint64_t messages;
  std::uint64_t cpuSeconds;
  pid_t parent;
  std::vector<sock_filter> filter;
  /// Bytes.
  std::uint64_t longestMessage;
};

/// Seals the process, answers as many messages as it may on `channel`, and exits. Called in a fresh
/// fork of the zygote.
[[noreturn]] void work(const KeelgateServer& server, const WorkerOptions& options, int channel);

}  // namespace Keelgate
