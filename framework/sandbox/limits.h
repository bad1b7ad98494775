// SPDX-License-Identifier: Apache-2.0
/// The numbers that bound a worker, and the resource limits that are set from them.
#pragma once

#include "framework/transport/frames.h"

#include <sys/resource.h>
#include <algorithm>
#include <cstddef>
#include <cstdint>

namespace Keelgate::Sandbox {

/// Address space that every worker has, whatever its message: the program's own needs and the
/// allocator's slack are far below. Untouched, it costs nothing.
constexpr std::size_t heapBase = std::size_t{128} << 20;

/// Address space for each byte of the message. The hungriest message is a list of empty payloads:
/// some 8 KB for the schema and the record of each, as against 45 bytes of XML or a dozen of
/// binary. A longer list than the base has room for, 16,000 at least and 26,000 in XML, would be no
/// push payload any more, and to grant its factor would let 64 MiB of message ask for the whole
/// machine.
constexpr std::size_t heapPerByte = 64;

/// Bytes of stack. The deepest message, 256 payloads each in a list of the other, takes 10 KB of
/// stack a level, or 14 KB in an unoptimised build: 3.6 MB. This is twice as much.
constexpr rlim_t stackLimit = rlim_t{8} << 20;

/// Descriptors of the zygote: the channel, its signals, the launcher's tether, and the one that a
/// fork frame brings.
constexpr rlim_t zygoteDescriptors = 16;

/// Bytes of heap that a message of `length` bytes is worth. Short ones all get the same, which is
/// there in the zygote already.
constexpr std::size_t heapFor(std::uint64_t length) {
  return heapBase +
         heapPerByte * static_cast<std::size_t>(std::max(length, Transport::shortMessage));
}

/// For the zygote and all that it forks: no core, no file, no locked memory, no message queue; a
/// bounded stack. Throws Refusal.
void limitZygote();

/// For a worker: no further process, no further descriptor, and `cpuSeconds` of processor time, at
/// the end of which it gets SIGXCPU. Behind the client's deadline, for a client that was stopped.
/// Throws Refusal.
void limitWorker(std::uint64_t cpuSeconds);

}  // namespace Keelgate::Sandbox
