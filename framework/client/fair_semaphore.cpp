// SPDX-License-Identifier: Apache-2.0
#include "framework/client/fair_semaphore.h"

#include "framework/client/launch.h"

#include <sys/eventfd.h>

#include <algorithm>
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
  semaphore.waiting_.push_back(this);
  semaphore.admitNext();
  if (state_ == State::admitted) return;
  try {
    wakeUp_ = semaphore.takeWakeUp();
  } catch (...) {
    std::erase(semaphore.waiting_, this);
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
    std::erase(semaphore_.waiting_, this);
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
    const auto next = std::find_if(waiting_.begin(), waiting_.end(), [this](const Permit* one) {
      return !one->large_ || freeLarge_ > 0;
    });
    if (next == waiting_.end()) return;
    Permit& admitted = **next;
    waiting_.erase(next);
    --free_;
    if (admitted.large_) --freeLarge_;
    admitted.state_ = Permit::State::admitted;
    if (admitted.wakeUp_) eventfd_write(admitted.wakeUp_.get(), 1);
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
