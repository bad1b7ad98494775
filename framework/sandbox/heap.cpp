// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/heap.h"

#include "framework/sandbox/refusal.h"

#include <malloc.h>
#include <cstdlib>

namespace Keelgate::Sandbox {

bool growHeap(std::size_t bytes) noexcept {
  for (; bytes >= Transport::heapBase; bytes /= 2) {
    // Volatile, or the compiler sees that nobody uses it.
    void* volatile area = std::malloc(bytes);
    if (area == nullptr) continue;
    std::free(area);
    return true;
  }
  return false;
}

void prepareHeap() {
#ifndef KEELGATE_UNSEALED
  mallopt(M_MMAP_MAX, 0);
  mallopt(M_ARENA_MAX, 1);
  // -1 is "never": a freed area stays ours, so that a freed message leaves room for the next one.
  mallopt(M_TRIM_THRESHOLD, -1);
  if (!growHeap(Transport::heapFor(0))) throw Refusal(Transport::Obstacle::heap);
#endif
  try {
    throw Refusal(Transport::Obstacle::heap, 0);
  } catch (const Refusal&) {
    return;
  }
}

}  // namespace Keelgate::Sandbox
