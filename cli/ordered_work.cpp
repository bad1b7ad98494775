// SPDX-License-Identifier: Apache-2.0
/// The queue is its own order: slots leave at the front, and only when all their replies are out.
#include "cli/ordered_work.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <new>
#include <system_error>
#include <thread>
#include <utility>

namespace Keelgate::CLI {

namespace {

/// Enough that a slow message does not leave the other threads idle.
constexpr std::size_t slotsPerThread = 16;

/// What may wait in bytes before no more is taken; a single job may be larger.
constexpr std::size_t largestWindow = std::size_t{64} << 20;

}  // namespace

OrderedWork::OrderedWork(Sink sink) : sink_(std::move(sink)), ended_(eventfd(0, EFD_CLOEXEC)) {
  if (ended_ < 0) throw std::system_error(errno, std::generic_category(), "eventfd");
}

OrderedWork::~OrderedWork() {
  close(ended_);
}

void OrderedWork::run(std::size_t threads, Source source) {
  source_ = std::move(source);
  capacity_ = threads * slotsPerThread;
  {
    std::vector<std::jthread> others;
    try {
      while (others.size() + 1 < threads) others.emplace_back([this] { work(); });
    } catch (const std::system_error&) {
      // Where there are no more threads to be had, these do the work.
    }
    work();
  }
  if (hadNoMemory_) throw std::bad_alloc();
}

void OrderedWork::work() {
  try {
    while (Slot* const slot = take()) {
      while (add(*slot, slot->job.next())) continue;
    }
  } catch (const std::bad_alloc&) {
    const std::lock_guard lock(mutex_);
    hadNoMemory_ = true;
    end();
  }
}

OrderedWork::Slot* OrderedWork::take() {
  const std::lock_guard taking(taking_);
  std::unique_lock lock(mutex_);
  room_.wait(lock, [&] {
    // A job larger than the window goes alone; it would wait for ever otherwise.
    return isOver_ || slots_.empty() || (slots_.size() < capacity_ && weight_ <= largestWindow);
  });
  if (isOver_ || isClosed_) return nullptr;
  lock.unlock();
  Optional<Job> job = source_();
  lock.lock();
  isClosed_ = !job;
  if (isOver_ || isClosed_) return nullptr;
  weight_ += job->weight;
  return &slots_.emplace_back(Slot{.job = std::move(*job)});
}

Bool OrderedWork::add(Slot& slot, Optional<JSON::Reply> reply) {
  std::unique_lock lock(mutex_);
  const Bool goesOn = reply.has_value();
  if (goesOn) {
    weight_ += JSON::sizeOf(reply->json);
    slot.replies.push_back(std::move(*reply));
  } else {
    slot.complete = true;
    // The requests themselves are not needed any more, and may be large.
    weight_ -= std::exchange(slot.job, {}).weight;
  }
  deliver(lock);
  room_.notify_one();
  return goesOn && !isOver_;
}

void OrderedWork::deliver(std::unique_lock<std::mutex>& lock) {
  // Whoever delivers looks again when the sink is through, so this reply is not forgotten.
  if (delivering_) return;
  delivering_ = true;
  while (!isOver_ && !slots_.empty()) {
    Slot& oldest = slots_.front();
    const Bool complete = oldest.complete;
    if (oldest.replies.empty() && !complete) break;
    const std::vector<JSON::Reply> due = std::exchange(oldest.replies, {});
    if (complete) slots_.pop_front();
    lock.unlock();
    // Without the lock: a reader of standard output that takes its time holds nobody else up.
    const Bool goOn = sink_(due, complete);
    lock.lock();
    // Not before: a reply that cannot be written yet is memory too.
    for (const JSON::Reply& reply : due) weight_ -= JSON::sizeOf(reply.json);
    // The threads that wait are told; those in work see it when they are through.
    if (!goOn) end();
  }
  delivering_ = false;
}

void OrderedWork::end() {
  isOver_ = true;
  room_.notify_all();
  // Cannot fail: the counter is far from full.
  eventfd_write(ended_, 1);
}

}  // namespace Keelgate::CLI
