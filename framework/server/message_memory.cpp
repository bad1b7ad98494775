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

/// With what the allocator keeps beside each block.
std::size_t costOf(void* block) noexcept {
  return malloc_usable_size(block) + sizeof(std::size_t);
}

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

void* allocate(std::size_t size) {
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

void release(void* block) noexcept {
  if (block == nullptr) return;
  allocated -= costOf(block);
  std::free(block);
}

}  // namespace Keelgate::MessageMemory
