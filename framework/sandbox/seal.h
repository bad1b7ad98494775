// SPDX-License-Identifier: Apache-2.0
/// The seal, its whole order in two functions: one for the process that forks workers, one for each
/// worker.
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
#include <span>
#include <vector>

namespace Keelgate::Sandbox {

/// What sealZygote achieved, and what it prepared for the zygote's work.
struct ZygoteSeal {
  /// The sum of the bits of Layer.
  std::uint32_t layers;
  /// The zygote as it sees itself.
  pid_t process;
  /// Hangs up when the launcher dies.
  int launcher;
  /// Readable when a worker has ended.
  int childDeaths;
  /// Whether it has what it takes to rewind workers.
  bool canRewind;
  std::vector<sock_filter> workerFilter;
};

/// Called in the process that the client started. Returns in the zygote, which can open nothing any
/// more; the calling process stays behind as its launcher.
ZygoteSeal sealZygote();

/// What a worker's seal is made of.
struct WorkerSeal {
  /// The channel to its client, whatever its number; none for one that waits for it.
  int channel = -1;
  /// The zygote as the worker sees it.
  pid_t parent = 0;
  std::uint64_t cpuSeconds = 0;
  /// Bytes: the length of the longest message that it will be given.
  std::uint64_t longestMessage = 0;
  /// It hands over to its zygote, and waits for a channel when it is sealed.
  bool rewindable = false;
  std::span<const sock_filter> filter;
};

/// Seals a worker, which has read nothing yet from its channel.
void sealWorker(const WorkerSeal& seal);

}  // namespace Keelgate::Sandbox
