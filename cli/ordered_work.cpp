// SPDX-License-Identifier: Apache-2.0
/// The queue is its own order: slots leave at the front, and only when their reply is there.
#include "cli/ordered_work.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>
#include <utility>

namespace Keelgate::CLI {

namespace {

/// Enough that a slow message does not leave the other threads idle.
constexpr std::size_t slotsPerThread = 16;

/// What may wait in bytes; a single job may be larger.
constexpr std::size_t largestWindow = std::size_t{64} << 20;

}  // namespace

OrderedWork::OrderedWork(std::size_t threads, Sink sink)
    : capacity_(threads * slotsPerThread), sink_(std::move(sink)), ended_(eventfd(0, EFD_CLOEXEC)) {
  if (ended_ < 0) throw std::system_error(errno, std::generic_category(), "eventfd");
  for (std::size_t i = 0; i < threads; ++i) threads_.emplace_back([this] { run(); });
}

OrderedWork::~OrderedWork() {
  {
    const std::lock_guard lock(mutex_);
    end();
  }
  join();
  close(ended_);
}

Bool OrderedWork::add(Job job, std::size_t weight) {
  std::unique_lock lock(mutex_);
  // A job larger than the window goes alone; it would wait for ever otherwise.
  room_.wait(lock, [&] {
    return stopped_ || slots_.empty() ||
           (slots_.size() < capacity_ && weight_ + weight <= largestWindow);
  });
  // Work may have ended while this thread waited for room.
  if (stopped_) return false;
  weight_ += weight;
  slots_.push_back({.job = std::move(job), .weight = weight, .reply = std::nullopt});
  work_.notify_one();
  return true;
}

void OrderedWork::finish() {
  {
    const std::lock_guard lock(mutex_);
    // The threads go on until the queue is empty, and then end.
    closed_ = true;
    work_.notify_all();
  }
  join();
}

void OrderedWork::run() {
  std::unique_lock lock(mutex_);
  for (;;) {
    work_.wait(lock, [&] { return stopped_ || closed_ || next_ < slots_.size(); });
    if (stopped_ || next_ == slots_.size()) return;
    // Stays where it is: a deque moves nothing when its ends change, and this slot is not answered
    // yet.
    Slot& slot = slots_[next_++];
    lock.unlock();
    Reply reply = slot.job();
    // The request itself is not needed any more, and may be large.
    slot.job = nullptr;
    lock.lock();
    slot.reply = std::move(reply);
    deliver(lock);
  }
}

void OrderedWork::deliver(std::unique_lock<std::mutex>& lock) {
  // Whoever delivers looks again after each reply, so this one is not forgotten.
  if (delivering_) return;
  delivering_ = true;
  while (!stopped_ && !slots_.empty() && slots_.front().reply) {
    const Reply reply = std::move(*slots_.front().reply);
    const std::size_t weight = slots_.front().weight;
    slots_.pop_front();
    // It counts from the front, which has just moved on.
    --next_;
    lock.unlock();
    // Without the lock: a reader of standard output that takes its time holds nobody else up.
    const Bool goOn = sink_(reply);
    lock.lock();
    // Not before: a reply that cannot be written yet is memory too.
    weight_ -= weight;
    room_.notify_one();
    // The threads that wait are told; those in work see it when they are through.
    if (!goOn) end();
  }
  delivering_ = false;
}

void OrderedWork::end() {
  stopped_ = true;
  work_.notify_all();
  room_.notify_all();
  // Cannot fail: the counter is far from full.
  eventfd_write(ended_, 1);
}

void OrderedWork::join() {
  for (std::thread& thread : threads_) thread.join();
  threads_.clear();
}

}  // namespace Keelgate::CLI
