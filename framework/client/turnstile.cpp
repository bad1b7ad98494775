// SPDX-License-Identifier: Apache-2.0
#include "framework/client/turnstile.h"

namespace Keelgate {

bool Turnstile::enter(Deadline deadline) {
  std::unique_lock lock(mutex_);
  if (free_ > 0) {
    --free_;
    return true;
  }
  Waiter self;
  waiting_.push_back(&self);
  const bool admitted = self.called.wait_until(lock, deadline, [&] { return self.admitted; });
  // Under the lock still, so nobody can admit a waiter that has gone.
  if (!admitted) std::erase(waiting_, &self);
  return admitted;
}

void Turnstile::leave() noexcept {
  const std::lock_guard lock(mutex_);
  if (waiting_.empty()) {
    ++free_;
    return;
  }
  // The place is handed over and never free in between.
  Waiter& next = *waiting_.front();
  waiting_.pop_front();
  next.admitted = true;
  next.called.notify_one();
}

}  // namespace Keelgate
