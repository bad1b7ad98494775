// SPDX-License-Identifier: Apache-2.0
/// Lets so many calls in at a time, in the order in which they came. A plain counter would let a
/// thread that calls in a loop overtake a waiting one for ever.
#pragma once

#include "framework/client/descriptor.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <mutex>
#include <vector>

namespace Keelgate {

/// All members may be called from any thread.
class FairSemaphore {
 public:
  /// `largePermits` of the permits at most are held by large calls; the others are kept free for
  /// small ones, which overtake a large call that waits for that reason alone.
  FairSemaphore(std::size_t permits, std::size_t largePermits, DescriptorRegistry& registry);

  /// One call's permit: it stands in line from the beginning, and leaves with its end. One thread
  /// at a time, but for the moment when it is admitted.
  class Permit {
   public:
    /// Throws std::bad_alloc, or StartFailure when it would have to wait and there is no descriptor
    /// left to wait on.
    Permit(FairSemaphore& semaphore, bool isLarge);
    ~Permit() { leave(); }
    Permit(const Permit&) = delete;
    Permit& operator=(const Permit&) = delete;

    [[nodiscard]] bool isAdmitted() const;
    /// Gives the permit back, or its turn up.
    void leave() noexcept;
    /// Readable as soon as it is admitted.
    [[nodiscard]] int descriptor() const noexcept { return wakeUp_.get(); }

   private:
    friend class FairSemaphore;
    enum class State { waiting, admitted, left };

    FairSemaphore& semaphore_;
    const bool large_;
    State state_ = State::waiting;
    /// An eventfd; none where it did not have to wait.
    Descriptor wakeUp_;
  };

  /// How many are held.
  [[nodiscard]] std::size_t held() const;

 private:
  void admitNext() noexcept;
  Descriptor takeWakeUp();

  DescriptorRegistry& registry_;
  mutable std::mutex mutex_;
  std::size_t free_;
  std::size_t freeLarge_;
  const std::size_t permits_;
  /// First come, first served.
  std::deque<Permit*> waiting_;
  /// For the next that wait.
  std::vector<Descriptor> spareWakeUps_;
};

}  // namespace Keelgate
