// SPDX-License-Identifier: Apache-2.0
#include "framework/client/call_queue.h"

#include <poll.h>

#include <algorithm>

namespace Keelgate {

void CallQueue::push(std::unique_ptr<Task> task) {
  const std::lock_guard lock(mutex_);
  const Deadline deadline = task->deadline();
  waiting_.push_back(std::move(task));
  earliest_ = std::min(earliest_, deadline);
  ++count_;
}

void CallQueue::run(bool mayWait) {
  begin();
  advanceReady(mayWait && done_.empty());
  while (!done_.empty()) {
    const std::unique_ptr<Task> task = std::move(done_.front());
    done_.pop_front();
    --count_;
    task->complete();
  }
  begin();
}

/// Those that have their turn, and those whose time is up.
void CallQueue::begin() {
  const std::lock_guard lock(mutex_);
  while (!waiting_.empty() && running_.size() < window_) {
    running_.push_back({.task = std::move(waiting_.front())});
    waiting_.pop_front();
  }
  const Deadline now = Clock::now();
  if (now < earliest_) return;
  earliest_ = Deadline::max();
  std::erase_if(waiting_, [&](std::unique_ptr<Task>& task) {
    const Deadline deadline = task->deadline();
    if (deadline <= now) {
      running_.push_back({.task = std::move(task)});
      return true;
    }
    earliest_ = std::min(earliest_, deadline);
    return false;
  });
}

void CallQueue::advanceReady(bool mayWait) {
  std::vector<pollfd> entries;
  entries.reserve(running_.size());
  eachWait([&](const Wait& wait) {
    entries.push_back({.fd = wait.descriptor, .events = wait.events, .revents = 0});
  });
  const Deadline until = mayWait ? nextTime() : Deadline();
  // A signal ends it early, and everything is looked at once more.
  pollUntil(entries.data(), entries.size(), until);
  const Deadline now = Clock::now();
  auto entry = entries.begin();
  for (auto at = running_.begin(); at != running_.end(); ++entry) {
    const bool ready = entry->revents != 0 || at->wait.until <= now;
    const Optional<Wait> wait = ready ? at->task->advance() : at->wait;
    if (wait) {
      at->wait = *wait;
      ++at;
    } else {
      done_.push_back(std::move(at->task));
      at = running_.erase(at);
    }
  }
}

Deadline CallQueue::nextTime() const {
  const std::lock_guard lock(mutex_);
  Deadline next = done_.empty() ? earliest_ : Deadline();
  eachWait([&](const Wait& wait) { next = std::min(next, wait.until); });
  return next;
}

}  // namespace Keelgate
