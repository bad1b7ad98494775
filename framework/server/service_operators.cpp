// SPDX-License-Identifier: Apache-2.0
/// The allocation of a service, counted. Deliberate: not a part of any library, or every program
/// that links the program's tables would count as well, and from several threads.
#include "framework/server/message_memory.h"

#include <cstddef>

#ifndef KEELGATE_UNSEALED

// The forms for arrays and those that do not throw call these.
void* operator new(std::size_t size) {
  return Keelgate::MessageMemory::allocate(size);
}
void operator delete(void* block) noexcept {
  Keelgate::MessageMemory::release(block);
}
void operator delete(void* block, std::size_t) noexcept {
  Keelgate::MessageMemory::release(block);
}

#endif
