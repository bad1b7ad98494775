// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/heap.h"

#include "framework/sandbox/refusal.h"

#include <malloc.h>
#include <algorithm>
#include <cstdlib>

namespace Keelgate::Sandbox {

bool growHeap(std::size_t bytes) noexcept {
  for (;;) {
    // Volatile, or the compiler sees that nobody uses it.
    void* volatile area = std::malloc(bytes);
    std::free(area);
    if (area != nullptr) return true;
    if (bytes <= Transport::heapBase) return false;
    bytes = std::max(bytes / 2, Transport::heapBase);
  }
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
