// SPDX-License-Identifier: Apache-2.0
/// The queue is its own order: slots leave at the front, and only when their reply is there.
#include "cli/ordered_work.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <new>
#include <system_error>
#include <utility>

namespace Keelgate::CLI {

namespace {

/// Enough that a slow message does not leave the other threads idle.
constexpr std::size_t slotsPerThread = 16;

/// What may wait in bytes; a single job may be larger.
constexpr std::size_t largestWindow = std::size_t{64} << 20;

JSON::Reply replyOf(const OrderedWork::Job& job) noexcept {
  try {
    return job();
  } catch (const std::bad_alloc&) {
    // Not even for the error. Nothing allocates from here on: the sink ends the work.
    return {.outcome = JSON::Outcome::serviceLost};
  }
}

}  // namespace

OrderedWork::OrderedWork(std::size_t threads, Sink sink)
    : capacity_(threads * slotsPerThread), sink_(std::move(sink)), ended_(eventfd(0, EFD_CLOEXEC)) {
  if (ended_ < 0) throw std::system_error(errno, std::generic_category(), "eventfd");
  due_.reserve(capacity_);
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

Bool OrderedWork::hasRoom(std::size_t weight) const {
  // A job larger than the window goes alone; it would wait for ever otherwise.
  return slots_.empty() || (slots_.size() < capacity_ && weight_ + weight <= largestWindow);
}

Bool OrderedWork::add(Job job, std::size_t weight) {
  std::unique_lock lock(mutex_);
  room_.wait(lock, [&] { return stopped_ || hasRoom(weight); });
  // Work may have ended while this thread waited for room.
  if (stopped_) return false;
  slots_.push_back({.job = std::move(job), .weight = weight, .reply = std::nullopt});
  weight_ += weight;
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

Bool OrderedWork::mayBegin() const {
  // The oldest always may, or nothing would ever leave the window.
  return next_ < slots_.size() && (next_ == 0 || weight_ <= largestWindow);
}

void OrderedWork::run() {
  std::unique_lock lock(mutex_);
  for (;;) {
    work_.wait(lock, [&] { return stopped_ || mayBegin() || (closed_ && next_ == slots_.size()); });
    if (stopped_ || next_ == slots_.size()) return;
    // Stays where it is: a deque moves nothing when its ends change, and this slot is not answered
    // yet.
    Slot& slot = slots_[next_++];
    lock.unlock();
    JSON::Reply reply = replyOf(slot.job);
    // The request itself is not needed any more, and may be large.
    slot.job = nullptr;
    lock.lock();
    complete(slot, std::move(reply));
    deliver(lock);
  }
}

void OrderedWork::complete(Slot& slot, JSON::Reply reply) {
  // From here on it is the reply that takes memory.
  weight_ -= std::exchange(slot.weight, JSON::sizeOf(reply.json));
  weight_ += slot.weight;
  slot.reply = std::move(reply);
}

void OrderedWork::deliver(std::unique_lock<std::mutex>& lock) {
  // Whoever delivers looks again when the sink is through, so this reply is not forgotten.
  if (delivering_) return;
  delivering_ = true;
  while (!stopped_ && !slots_.empty() && slots_.front().reply) {
    std::size_t weight = 0;
    while (!slots_.empty() && slots_.front().reply) {
      due_.push_back(std::move(*slots_.front().reply));
      weight += slots_.front().weight;
      slots_.pop_front();
      // It counts from the front, which has just moved on.
      --next_;
    }
    lock.unlock();
    // Without the lock: a reader of standard output that takes its time holds nobody else up.
    const Bool goOn = sink_(due_);
    due_.clear();
    lock.lock();
    // Not before: a reply that cannot be written yet is memory too.
    weight_ -= weight;
    // Not for every reply: the adder would be woken for each line that it adds.
    if (slots_.size() <= capacity_ / 2) room_.notify_one();
    // Several: the window may have kept all of them from their next job.
    if (mayBegin()) work_.notify_all();
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
