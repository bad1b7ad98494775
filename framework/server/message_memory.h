// SPDX-License-Identifier: Apache-2.0
/// What the program may allocate for the message at hand. It replaces operator new and delete of a
/// service process with ones that count, so that a message has the same memory whether its worker
/// was made for it alone or has served others.
///
/// For processes with one thread. A build for a sanitizer does not count.
#pragma once

#include <cstddef>

namespace Keelgate::MessageMemory {

/// From here on at most so many bytes more may be allocated at a time; beyond that operator new
/// throws std::bad_alloc.
void begin(std::size_t bytes) noexcept;

/// The most bytes that have been allocated at a time since begin.
std::size_t peak() noexcept;

}  // namespace Keelgate::MessageMemory
