// SPDX-License-Identifier: Apache-2.0
#include "framework/client/call_queue.h"

#include <poll.h>

#include <algorithm>

namespace Keelgate {

CallQueue::CallQueue(Pool& pool) : window_(pool.processes()) {
  while (pool.sharesWorkers() && pipelines_.size() < window_) pipelines_.emplace_back(pool);
}

void CallQueue::push(CallList calls) {
  const std::lock_guard lock(mutex_);
  for (const Call& call : calls) earliest_ = std::min(earliest_, call.deadline());
  count_ += calls.size();
  waiting_.splice(waiting_.end(), calls);
}

void CallQueue::run(bool mayWait) {
  begin();
  advanceReady(mayWait && done_.empty());
  while (!done_.empty()) {
    CallList one;
    one.splice(one.end(), done_, done_.begin());
    --count_;
    one.front().complete();
  }
  begin();
}

/// Those that have their turn, and those whose time is up.
void CallQueue::begin() {
  const std::lock_guard lock(mutex_);
  while (!waiting_.empty()) {
    Call& next = waiting_.front();
    if (next.isShared() && !pipelines_.empty()) {
      Pipeline* const pipeline = freePipeline();
      if (pipeline == nullptr) break;
      if (next.mayBeSent()) {
        pipeline->add(waiting_);
        continue;
      }
    }
    if (!mayBegin()) break;
    running_.splice(running_.end(), waiting_, waiting_.begin());
  }
  const Deadline now = Clock::now();
  if (now < earliest_) return;
  earliest_ = Deadline::max();
  for (auto at = waiting_.begin(); at != waiting_.end();) {
    const auto call = at++;
    if (call->deadline() <= now) {
      running_.splice(running_.end(), waiting_, call);
    } else {
      earliest_ = std::min(earliest_, call->deadline());
    }
  }
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
    const auto call = at++;
    const bool isReady = entry->revents != 0 || call->wait().until <= now;
    if (isReady && !call->advance()) done_.splice(done_.end(), running_, call);
  }
  advancePipelines();
}

/// All of them: one that has nothing to do finds out by one system call.
void CallQueue::advancePipelines() noexcept {
  CallList alone;
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
    // Up to the end of its work: a worker that is not given back by then is lost.
    while (pipeline.wait() && pipeline.wait()->until == Deadline()) pipeline.advance(done_, alone);
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
