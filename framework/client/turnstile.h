// SPDX-License-Identifier: Apache-2.0
/// Lets so many calls in at a time, in the order in which they came. A plain counter would let a
/// thread that calls in a loop overtake a waiting one for ever.
#pragma once

#include "framework/client/deadline.h"

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <mutex>

namespace Keelgate {

/// All members may be called from any thread.
class Turnstile {
 public:
  explicit Turnstile(std::size_t places) : free_(places) {}

  /// Whether a place came free before the deadline. Throws std::bad_alloc. Whoever entered leaves,
  /// exactly once.
  bool enter(Deadline deadline);
  void leave() noexcept;

 private:
  /// On the stack of the thread that waits. One condition each: a shared one would wake all for one
  /// place.
  struct Waiter {
    std::condition_variable called;
    bool admitted = false;
  };

  std::mutex mutex_;
  /// Above 0 only while nobody waits.
  std::size_t free_;
  /// First come, first served.
  std::deque<Waiter*> waiting_;
};

}  // namespace Keelgate
