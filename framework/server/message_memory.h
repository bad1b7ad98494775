// SPDX-License-Identifier: Apache-2.0
/// What the program may allocate for the message at hand. Operator new and delete of a service
/// count here, so that a message has the same memory whether its worker was made for it alone or
/// has served others. They stand in service_operators.cpp, which services alone have in them: in a
/// program with threads the counters would go wrong.
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

/// A counted block, which `release` takes back. Throws std::bad_alloc.
void* allocate(std::size_t size);
void release(void* block) noexcept;

}  // namespace Keelgate::MessageMemory
