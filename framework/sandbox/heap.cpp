// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/heap.h"

#include "framework/contracts/memory_budget.h"
#include "framework/contracts/start_step.h"

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
    if (bytes <= budgetBase) return false;
    bytes = std::max(bytes / 2, budgetBase);
  }
}

void prepareHeap() {
#ifndef KEELGATE_UNSEALED
  mallopt(M_MMAP_MAX, 0);
  mallopt(M_ARENA_MAX, 1);
  // -1 is "never": a freed area stays ours, so that a freed message leaves room for the next one.
  mallopt(M_TRIM_THRESHOLD, -1);
  if (!growHeap(memoryBudget(shortMessage))) throw StartError(StartStep::reserveHeap);
#endif
  try {
    throw StartError(StartStep::reserveHeap, 0);
  } catch (const StartError&) {
    return;
  }
}

}  // namespace Keelgate::Sandbox
