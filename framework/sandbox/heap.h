// SPDX-License-Identifier: Apache-2.0
/// The heap of a worker: all of it is there before the first byte from outside is read, and no more
/// comes. That of a short message is mapped once, in the zygote, and copied by each fork; as long
/// as nobody writes to it that costs nothing.
///
/// It lies in a mapping that the kernel places, and begins at a random point of it. The area that
/// the C library grows by itself, next to where a static program ends, has 18 bits of randomness:
/// a message that fills a few megabytes would find its own bytes at an address that it can guess.
///
/// For single-threaded processes.
#pragma once

#include <cstddef>

namespace Keelgate::Sandbox {

/// The zygote's part, before its filter: settings of the allocator and the one-time work of the
/// exception runtime, whose system call a sealed worker could not make. Throws StartError.
void prepareHeap();

/// The zygote's part, under its filter, which gives no memory next to the program any more: takes
/// what is left there, so that nothing of it is ever handed out to a message.
void abandonFirstHeap();

/// The zygote's part, under its filter, for the heap of a short message, and that of a worker that
/// needs more: maps a heap of so many bytes, or of the half, a quarter and so on, where the machine
/// has not that much: most messages need little of what they may have. Throws StartError when not
/// even the heap of an empty message is to be had.
void reserveHeap(std::size_t bytes);

}  // namespace Keelgate::Sandbox
