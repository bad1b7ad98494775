// SPDX-License-Identifier: Apache-2.0
#include "framework/client/call_queue.h"

#include <poll.h>

#include <algorithm>

namespace Keelgate {

CallQueue::CallQueue(Pool& pool) : window_(pool.processes()) {
  while (pool.sharesWorkers() && pipelines_.size() < window_) pipelines_.emplace_back(pool);
}

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
  while (!waiting_.empty()) {
    Task& next = *waiting_.front();
    if (next.isShared() && !pipelines_.empty()) {
      Pipeline* const pipeline = freePipeline();
      if (pipeline == nullptr) break;
      if (next.request() != nullptr) {
        pipeline->add(waiting_);
        continue;
      }
    }
    if (!mayBegin()) break;
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

/// As many as there are permits: whoever has begun is not to wait for one, because its time counts.
bool CallQueue::mayBegin() const noexcept {
  const auto busy = std::count_if(pipelines_.begin(), pipelines_.end(),
                                  [](const Pipeline& one) { return one.wait().has_value(); });
  return running_.size() + static_cast<std::size_t>(busy) < window_;
}

/// The one with the least to do, if it has room.
Pipeline* CallQueue::freePipeline() noexcept {
  const bool anyOfThem = mayBegin();
  Pipeline* least = nullptr;
  for (Pipeline& one : pipelines_) {
    if (!one.hasRoom() || !(anyOfThem || one.wait())) continue;
    if (least == nullptr || one.count() < least->count()) least = &one;
  }
  return least;
}

void CallQueue::advanceReady(bool mayWait) {
  std::vector<pollfd> entries;
  entries.reserve(running_.size() + pipelines_.size());
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
  advancePipelines();
}

/// All of them: one that has nothing to do finds out by one system call.
void CallQueue::advancePipelines() noexcept {
  TaskList alone;
  for (Pipeline& pipeline : pipelines_) {
    if (pipeline.wait()) pipeline.advance(done_, alone);
  }
  {
    const std::lock_guard lock(mutex_);
    waiting_.splice(waiting_.begin(), alone);
  }
  // Before anything is completed: workers have their next messages meanwhile.
  begin();
  for (Pipeline& pipeline : pipelines_) {
    if (pipeline.wait() && pipeline.wait()->until == Deadline()) pipeline.advance(done_, alone);
  }
  const std::lock_guard lock(mutex_);
  waiting_.splice(waiting_.begin(), alone);
}

Deadline CallQueue::nextTime() const {
  const std::lock_guard lock(mutex_);
  Deadline next = done_.empty() ? earliest_ : Deadline();
  eachWait([&](const Wait& wait) { next = std::min(next, wait.until); });
  return next;
}

}  // namespace Keelgate
