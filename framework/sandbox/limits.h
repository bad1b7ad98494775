// SPDX-License-Identifier: Apache-2.0
/// The numbers that bound a worker, and the resource limits that are set from them.
#pragma once

#include <sys/resource.h>
#include <cstddef>
#include <cstdint>

namespace Keelgate::Sandbox {

/// Address space that every worker has, whatever its message: the program's own needs and the
/// allocator's slack are far below. Untouched, it costs nothing.
constexpr std::size_t heapBase = std::size_t{128} << 20;

/// Address space for each byte of the message. The densest honest message is a list of payloads in
/// which a few bytes ask for a record of 156 fields; what shares one object a thousand times is
/// bounded by the decoder, and lands here when it is not.
constexpr std::size_t heapPerByte = 64;

/// Bytes of stack. The decoder recurses once for each of at most 512 nested containers.
constexpr rlim_t stackLimit = rlim_t{1} << 20;

/// Descriptors of the zygote: the channel, its signals, the launcher's tether, and the one that a
/// fork frame brings.
constexpr rlim_t zygoteDescriptors = 16;

/// Bytes of heap that a message of `length` bytes is worth.
constexpr std::size_t heapFor(std::uint64_t length) {
  return heapBase + heapPerByte * static_cast<std::size_t>(length);
}

/// For the zygote and all that it forks: no core, no file, no locked memory, no message queue; a
/// small stack. Throws Refusal.
void limitZygote();

/// For a worker: no further process, no further descriptor, and `cpuSeconds` of processor time, at
/// the end of which it gets SIGXCPU. Behind the client's deadline, for a client that was stopped.
/// Throws Refusal.
void limitWorker(std::uint64_t cpuSeconds);

}  // namespace Keelgate::Sandbox
