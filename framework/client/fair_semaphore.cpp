// SPDX-License-Identifier: Apache-2.0
#include "framework/client/fair_semaphore.h"

#include "framework/client/launch.h"

#include <sys/eventfd.h>

#include <cerrno>

namespace Keelgate {

FairSemaphore::FairSemaphore(std::size_t permits, std::size_t largePermits,
                             DescriptorRegistry& registry)
    : registry_(registry), free_(permits), freeLarge_(largePermits), permits_(permits) {
  // So that giving one back allocates nothing.
  spareWakeUps_.reserve(permits);
}

FairSemaphore::Permit::Permit(FairSemaphore& semaphore, bool isLarge)
    : semaphore_(semaphore), large_(isLarge) {
  const std::lock_guard lock(semaphore.mutex_);
  std::deque<Permit*>& line = large_ ? semaphore.waitingLarge_ : semaphore.waitingSmall_;
  turn_ = semaphore.turns_++;
  line.push_back(this);
  semaphore.admitNext();
  if (state_ == State::admitted) return;
  try {
    wakeUp_ = semaphore.takeWakeUp();
  } catch (...) {
    std::erase(line, this);
    throw;
  }
}

bool FairSemaphore::Permit::isAdmitted() const {
  const std::lock_guard lock(semaphore_.mutex_);
  return state_ == State::admitted;
}

void FairSemaphore::Permit::leave() noexcept {
  const std::lock_guard lock(semaphore_.mutex_);
  if (state_ == State::left) return;
  if (state_ == State::admitted) {
    ++semaphore_.free_;
    if (large_) ++semaphore_.freeLarge_;
  } else {
    // Under the lock, so nobody can admit one that has gone.
    std::erase(large_ ? semaphore_.waitingLarge_ : semaphore_.waitingSmall_, this);
  }
  state_ = State::left;
  if (wakeUp_ && semaphore_.spareWakeUps_.size() < semaphore_.permits_) {
    eventfd_t ignored;
    eventfd_read(wakeUp_.get(), &ignored);
    semaphore_.spareWakeUps_.push_back(std::move(wakeUp_));
  }
  semaphore_.admitNext();
}

std::size_t FairSemaphore::held() const {
  const std::lock_guard lock(mutex_);
  return permits_ - free_;
}

void FairSemaphore::admitNext() noexcept {
  while (free_ > 0) {
    const bool anySmall = !waitingSmall_.empty();
    const bool anyLarge = !waitingLarge_.empty() && freeLarge_ > 0;
    if (!anySmall && !anyLarge) return;
    const bool large =
        anyLarge && (!anySmall || waitingLarge_.front()->turn_ < waitingSmall_.front()->turn_);
    std::deque<Permit*>& line = large ? waitingLarge_ : waitingSmall_;
    Permit& next = *line.front();
    line.pop_front();
    --free_;
    if (large) --freeLarge_;
    next.state_ = Permit::State::admitted;
    if (next.wakeUp_) eventfd_write(next.wakeUp_.get(), 1);
  }
}

Descriptor FairSemaphore::takeWakeUp() {
  if (spareWakeUps_.empty()) {
    Descriptor made(registry_, eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    if (!made) throw shortage("A call could not wait for its turn", errno);
    return made;
  }
  Descriptor spare = std::move(spareWakeUps_.back());
  spareWakeUps_.pop_back();
  return spare;
}

}  // namespace Keelgate
