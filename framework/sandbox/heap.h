// SPDX-License-Identifier: Apache-2.0
/// The heap: all of it is there before the first byte from outside is read, and no more comes.
#pragma once

#include <cstddef>

namespace Keelgate::Sandbox {

/// Makes the allocator live on one growing area that never shrinks, grows it as far as a short
/// message needs, and has the exception runtime do its one-time work, whose system call a sealed
/// worker could not make. Throws StartError. Single-threaded callers only.
void prepareHeap();

/// Grows the free part of the heap to `bytes`, or to the half, a quarter and so on, and at the
/// least to the base, where the machine has not that much: most messages need little of what they
/// may have. False when not even that is to be had.
bool growHeap(std::size_t bytes) noexcept;

}  // namespace Keelgate::Sandbox
