// SPDX-License-Identifier: Apache-2.0
/// The seal, in two functions: one for the process that forks workers, one for each worker.
///
/// What only the zygote can pay for is done once: namespaces, the empty root, Landlock,
/// credentials. What must differ from worker to worker is done by each: its descriptor, its limits,
/// its heap, its filter. A build for a sanitizer has no seal and reports no layers.
///
/// Both are for single-threaded processes and throw StartError.
#pragma once

#include <linux/filter.h>
#include <sys/types.h>
#include <cstdint>
#include <vector>

namespace Keelgate::Sandbox {

/// What sealZygote achieved, and what it prepared for the workers.
struct ZygoteSeal {
  /// Layer.
  std::uint32_t layers;
  std::vector<sock_filter> workerFilter;
};

/// Seals the zygote, which can open nothing afterwards. `given` are the layers that the launcher
/// gave it.
ZygoteSeal sealZygote(std::uint32_t given);

/// What a worker's seal is made of.
struct WorkerSeal {
  /// The channel to its client, whatever its number.
  int channel;
  /// The zygote as the worker sees it.
  pid_t parent;
  std::uint64_t cpuSeconds;
  /// Bytes, in the length of the longest message that it will be given.
  std::uint64_t longestMessage;
  const std::vector<sock_filter>& filter;
};

/// Seals a worker, which has read nothing yet from its channel.
void sealWorker(const WorkerSeal& seal);

}  // namespace Keelgate::Sandbox
