// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/heap.h"

#include "framework/contracts/memory_budget.h"
#include "framework/contracts/start_step.h"

#include <malloc.h>
#include <sys/random.h>
#include <unistd.h>
#include <algorithm>
#include <cstdint>
#include <cstdlib>

namespace Keelgate::Sandbox {

namespace {

/// The area that the C library has grown by itself.
struct Area {
  std::uintptr_t begin;
  std::uintptr_t end;
};
Area firstHeap{};

/// Bytes that are left free in front of a worker's heap: some kernels place large mappings on
/// bounds of 2 MiB, which takes nine bits of randomness from them. Of each zygote.
std::size_t randomOffset = 0;

/// Volatile, or the compiler sees that nobody uses the block.
void* allocate(std::size_t bytes) noexcept {
  void* volatile block = std::malloc(bytes);
  return block;
}

bool liesInFirstHeap(const void* block) noexcept {
  const auto address = reinterpret_cast<std::uintptr_t>(block);
  return address >= firstHeap.begin && address < firstHeap.end;
}

}  // namespace

void prepareHeap() {
#ifndef KEELGATE_UNSEALED
  mallopt(M_MMAP_MAX, 0);
  mallopt(M_ARENA_MAX, 1);
  // -1 is "never": a freed area stays ours, so that a freed message leaves room for the next one.
  mallopt(M_TRIM_THRESHOLD, -1);
  const auto end = reinterpret_cast<std::uintptr_t>(sbrk(0));
  firstHeap = {.begin = end - mallinfo2().arena, .end = end};

  constexpr std::size_t largestOffset = std::size_t{2} << 20;
  std::uint32_t random = 0;
  if (getrandom(&random, sizeof random, 0) != sizeof random) {
    throw StartError(StartStep::reserveHeap);
  }
  randomOffset = random % largestOffset;
#endif
  // The first one that is thrown makes a system call.
  try {
    throw StartError(StartStep::reserveHeap, 0);
  } catch (const StartError&) {
    return;
  }
}

void abandonFirstHeap() {
  // Every size that the allocator keeps free blocks of, the small ones one by one.
  constexpr std::size_t largest = std::size_t{1} << 17;
  constexpr std::size_t oneByOne = 1100;
  constexpr std::size_t step = 16;
  constexpr std::size_t smallest = 24;
  for (std::size_t size = largest; size >= smallest; size -= size > oneByOne ? size / 8 : step) {
    void* block = allocate(size);
    while (block != nullptr && liesInFirstHeap(block)) block = allocate(size);
    std::free(block);
  }
}

void reserveHeap(std::size_t bytes) {
  static std::size_t reserved = 0;
  if (bytes <= reserved) return;
  reserved = bytes;
  // Two blocks in one piece of memory: the first is kept, and what the second was is the heap.
  void* whole = allocate(randomOffset + bytes);
  while (whole == nullptr && bytes > heapFor(0)) {
    bytes = std::max(bytes / 2, heapFor(0));
    whole = allocate(randomOffset + bytes);
  }
  std::free(whole);
  // For good, also of a heap that a longer one follows.
  static void* inFront;
  inFront = whole == nullptr ? nullptr : allocate(randomOffset);
  if (inFront == nullptr) throw StartError(StartStep::reserveHeap);
}

}  // namespace Keelgate::Sandbox
