// SPDX-License-Identifier: Apache-2.0
/// A reply is read by recursion, as deep as records nest. A thread without room for that would die
/// of a message that others take.
#pragma once

#include <cstddef>

namespace Keelgate {

/// What the deepest reply takes in an optimised build, 116 KB, and as much again.
constexpr std::size_t minimumStack = std::size_t{256} << 10;

/// Throws HostError (resourcesExhausted) where the calling thread has less than that left. A stack
/// of the application's own making, as of a coroutine, is not known to the system and not checked.
void requireStack();

}  // namespace Keelgate
