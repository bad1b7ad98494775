// SPDX-License-Identifier: Apache-2.0
/// The numbers that bound a worker, and the resource limits that are set from them.
#pragma once

#include <sys/resource.h>
#include <cstdint>

namespace Keelgate::Sandbox {

/// Bytes of stack. The deepest message, 256 payloads each in a list of the other, takes 0.34 MB, or
/// 0.45 MB in an unoptimised build.
constexpr rlim_t stackLimit = rlim_t{8} << 20;

/// Descriptors of the zygote: the channel, its signals, the launcher's tether, and the one that a
/// fork frame brings.
constexpr rlim_t zygoteDescriptors = 16;
/// With five for each worker that is rewound.
constexpr rlim_t rewindingDescriptors = zygoteDescriptors + 5 * 64;

/// Whether the one who started the service lets it have so many descriptors.
bool mayHaveDescriptors(rlim_t count);

/// For the zygote and all that it forks: no core, no file, no locked memory, no message queue; a
/// bounded stack, and so many descriptors. Throws StartError.
void limitZygote(rlim_t descriptors);

/// For a worker, after limitZygote in its zygote: no further process, no further descriptor, and
/// `cpuSeconds` of processor time, at the end of which it gets SIGXCPU. Behind the client's
/// deadline, for a client that was stopped. Throws StartError.
void limitWorker(std::uint64_t cpuSeconds);

/// Whether a worker may have so much, by what the one who started the service has set. After
/// limitZygote.
bool mayHaveProcessorTime(std::uint64_t cpuSeconds) noexcept;

/// For the zygote and all that it forks: the kernel looks for memory here first when the machine
/// runs out of it. Where that is refused, or /proc is not there, nothing changes.
void offerMemoryFirst();

/// For a worker: everybody else who wants the processor gets it first, the zygote and the client
/// among them, so that a message that wastes it costs others little. Throws StartError.
void lowerPriority();

}  // namespace Keelgate::Sandbox
