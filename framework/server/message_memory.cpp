// SPDX-License-Identifier: Apache-2.0
#include "framework/server/message_memory.h"

#include <malloc.h>
#include <algorithm>
#include <cstdlib>
#include <limits>
#include <new>

namespace Keelgate::MessageMemory {

namespace {

std::size_t allocated = 0;
std::size_t atBegin = 0;
std::size_t most = 0;
std::size_t limit = std::numeric_limits<std::size_t>::max();

#ifndef KEELGATE_UNSEALED
/// With what the allocator keeps beside each block.
std::size_t costOf(void* block) noexcept {
  return malloc_usable_size(block) + sizeof(std::size_t);
}
#endif

}  // namespace

void begin(std::size_t bytes) noexcept {
  // A block of this size has the allocator join the small ones that the last message has left.
  constexpr std::size_t joining = 2048;
  std::free(std::malloc(joining));
  atBegin = most = allocated;
  limit = allocated + bytes;
}

std::size_t peak() noexcept {
  return most - atBegin;
}

}  // namespace Keelgate::MessageMemory

#ifndef KEELGATE_UNSEALED
using namespace Keelgate::MessageMemory;

// The forms for arrays and those that do not throw call these.
void* operator new(std::size_t size) {
  // Compared so that nothing can wrap. What is allocated may be above the limit by a block's own
  // overhead.
  if (allocated > limit || size > limit - allocated) throw std::bad_alloc();
  // A block of no bytes has an address of its own, too.
  void* const block = std::malloc(std::max<std::size_t>(size, 1));
  if (block == nullptr) throw std::bad_alloc();
  allocated += costOf(block);
  most = std::max(most, allocated);
  return block;
}
void operator delete(void* block) noexcept {
  if (block == nullptr) return;
  allocated -= costOf(block);
  std::free(block);
}
void operator delete(void* block, std::size_t) noexcept {
  operator delete(block);
}
#endif
