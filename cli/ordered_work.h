// SPDX-License-Identifier: Apache-2.0
/// Many messages in work at once, their replies in the order in which they came.
///
/// One thread adds jobs. Each job runs on one of the worker threads; whichever of them completes
/// the oldest job hands all replies that are due to the sink, one at a time. Nothing is held back:
/// a reply whose predecessors are out goes out. What waits is bounded in number and in bytes, so an
/// endless input takes no endless memory: `add` blocks while the window is full.
#pragma once

#include "cli/reply.h"

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

namespace Keelgate::CLI {

class OrderedWork {
 public:
  using Job = std::function<Reply()>;
  /// Called from any of the threads, never from two at once. False ends all work: nobody reads any
  /// more, or there is no service to ask.
  using Sink = std::function<Bool(const Reply&)>;

  /// Jobs and the sink may throw nothing but std::bad_alloc, which ends the program.
  OrderedWork(std::size_t threads, Sink sink);
  /// Waits for the jobs that are in work; drops the others.
  ~OrderedWork();
  OrderedWork(const OrderedWork&) = delete;
  OrderedWork& operator=(const OrderedWork&) = delete;

  /// `weight` is the number of bytes that the job keeps in memory. False when work has ended.
  Bool add(Job job, std::size_t weight);
  /// Waits until every reply has gone to the sink, or work has ended.
  void finish();

  /// Becomes readable when work has ended, for a poll beside the input.
  [[nodiscard]] int endedDescriptor() const { return ended_; }

 private:
  /// A message on its way: waiting, in work, or answered and waiting for its turn.
  struct Slot {
    Job job;
    std::size_t weight;
    Optional<Reply> reply;
  };

  /// What each of the threads does.
  void run();
  /// Hands out what is due. The lock is given up while the sink works.
  void deliver(std::unique_lock<std::mutex>& lock);
  void end();
  void join();

  /// How many slots there may be.
  const std::size_t capacity_;
  const Sink sink_;
  int ended_;

  /// Guards everything below.
  std::mutex mutex_;
  /// For the workers: there is a job, or there will be none. For the adder: there is room.
  std::condition_variable work_;
  std::condition_variable room_;
  /// From the oldest reply that is not out yet. References to slots survive additions and removals
  /// at the ends.
  std::deque<Slot> slots_;
  /// The first slot that no thread has taken.
  std::size_t next_ = 0;
  std::size_t weight_ = 0;
  /// No more jobs come; or no more replies are wanted.
  Bool closed_ = false;
  Bool stopped_ = false;
  /// A thread is with the sink. It looks for more when it is back.
  Bool delivering_ = false;
  std::vector<std::thread> threads_;
};

}  // namespace Keelgate::CLI
