// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/steps.h"

#include "framework/contracts/memory_budget.h"
#include "framework/contracts/start_step.h"

#include <malloc.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/random.h>
#include <unistd.h>
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <utility>

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

/// Most of the time that a long message takes would go into page faults. A machine without such
/// pages gives small ones.
void preferHugePages(const Area& heap) noexcept {
  constexpr std::uintptr_t page = 4096;
  const std::uintptr_t begin = (heap.begin + page - 1) / page * page;
  madvise(reinterpret_cast<void*>(begin), heap.end - begin, MADV_HUGEPAGE);
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
  // A short message writes to little of one, and it would be restored whole.
  prctl(PR_SET_THP_DISABLE, 1, 0, 0, 0);
  const auto end = reinterpret_cast<std::uintptr_t>(sbrk(0));
  firstHeap = {.begin = end - mallinfo2().arena, .end = end};

  constexpr std::size_t largestOffset = std::size_t{2} << 20;
  std::uint32_t random = 0;
  if (getrandom(&random, sizeof random, 0) != sizeof random) {
    throw StartError(StartStep::reserveHeap);
  }
  // Not 0, which would be no block.
  randomOffset = random % largestOffset + 1;
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
  void* whole = allocate(randomOffset + bytes);
  while (whole == nullptr && bytes > heapFor(0)) {
    bytes = std::max(bytes / 2, heapFor(0));
    whole = allocate(randomOffset + bytes);
  }
  const auto begin = reinterpret_cast<std::uintptr_t>(whole);
  // What is cut off is the heap. The rest is kept for good, also when a longer one follows.
  static void* inFront;
  inFront = whole == nullptr ? nullptr : std::realloc(whole, randomOffset);
  if (inFront == nullptr) throw StartError(StartStep::reserveHeap);
  static Area heap{};
  const Area before = std::exchange(heap, {.begin = begin, .end = begin + randomOffset + bytes});
  if (before.end == 0) return;
  // The one for a long message, who has that of a short one as well.
  prctl(PR_SET_THP_DISABLE, 0, 0, 0, 0);
  preferHugePages(before);
  preferHugePages(heap);
}

}  // namespace Keelgate::Sandbox
