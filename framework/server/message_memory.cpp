// SPDX-License-Identifier: Apache-2.0
#include "framework/server/message_memory.h"

#include <malloc.h>
#include <algorithm>
#include <cstdlib>
#include <functional>
#include <limits>
#include <new>

namespace Keelgate::MessageMemory {

namespace {

std::size_t allocated = 0;
std::size_t atBegin = 0;
std::size_t most = 0;
std::size_t limit = std::numeric_limits<std::size_t>::max();

/// Where small blocks come from while a message is at hand: cut off one after the other, and all
/// free at once when the next message begins. Most blocks are short texts, which a worker for one
/// message has no use in freeing. It has one size and is not counted, so that it makes no
/// difference to what a message may take.
constexpr std::size_t arenaSize = std::size_t{256} << 10;
constexpr std::size_t smallBlock = 512;
std::byte* arena = nullptr;
std::size_t arenaUsed = arenaSize;
/// Below it is what messages have left behind, in some static object, with what lies before that.
std::size_t arenaBegin = 0;
/// Of the blocks behind it, those that were not released.
std::size_t arenaBlocks = 0;

/// With what the allocator keeps beside each block.
std::size_t costOf(void* block) noexcept {
  return malloc_usable_size(block) + sizeof(std::size_t);
}

}  // namespace

void begin(std::size_t bytes) noexcept {
  // A block of this size has the allocator join the small ones that the last message has left.
  constexpr std::size_t joining = 2048;
  std::free(std::malloc(joining));
  if (arena == nullptr) {
    arena = static_cast<std::byte*>(std::malloc(arenaSize));
    arenaBegin = arena == nullptr ? arenaSize : 0;
  } else if (arenaBlocks != 0) {
    arenaBegin = arenaUsed;
  }
  arenaUsed = arenaBegin;
  arenaBlocks = 0;
  atBegin = most = allocated;
  limit = allocated + bytes;
}

std::size_t peak() noexcept {
  return most - atBegin;
}

void* allocate(std::size_t size) {
  constexpr std::size_t alignment = alignof(std::max_align_t);
  const std::size_t room = (size + alignment - 1) / alignment * alignment;
  if (size - 1 < smallBlock && room <= arenaSize - arenaUsed) {
    std::byte* const block = arena + arenaUsed;
    arenaUsed += room;
    ++arenaBlocks;
    return block;
  }
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
  const std::less<const void*> isBefore;
  if (!isBefore(block, arena) && isBefore(block, arena + arenaSize)) {
    if (!isBefore(block, arena + arenaBegin)) --arenaBlocks;
    return;
  }
  allocated -= costOf(block);
  std::free(block);
}

}  // namespace Keelgate::MessageMemory
