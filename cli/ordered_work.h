// SPDX-License-Identifier: Apache-2.0
/// Many messages in work at once, their replies in the order in which they came.
///
/// One thread adds jobs. Each job runs on one of the worker threads; whichever of them completes
/// the oldest job hands all replies that are due to the sink. Nothing is held back: a reply whose
/// predecessors are out goes out.
///
/// What waits is bounded in number and in bytes, so that an endless input takes no endless memory,
/// and neither does one slow message before many that have long replies: `add` blocks while the
/// window is full, and no job but the oldest is begun then.
#pragma once

#include "framework/json/reply.h"

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
  /// One that fails for want of memory costs its own message and no other.
  using Job = std::function<JSON::Reply()>;
  /// Takes the replies that are due, at least one. Called from any of the threads, never from two
  /// at once. False ends all work: nobody reads any more, or there is no service to ask. It must
  /// not throw.
  using Sink = std::function<Bool(const std::vector<JSON::Reply>& due)>;

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
    Optional<JSON::Reply> reply;
  };

  [[nodiscard]] Bool hasRoom(std::size_t weight) const;
  [[nodiscard]] Bool mayBegin() const;
  /// What each of the threads does.
  void run();
  void complete(Slot& slot, JSON::Reply reply);
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
  /// For the workers: a job may be begun, or there will be none. For the adder: there is room.
  std::condition_variable work_;
  std::condition_variable room_;
  /// From the oldest reply that is not out yet. References to slots survive additions and removals
  /// at the ends.
  std::deque<Slot> slots_;
  /// The first slot that no thread has taken.
  std::size_t next_ = 0;
  /// Of the slots and of the replies that the sink has: requests, then replies, in bytes.
  std::size_t weight_ = 0;
  /// No more jobs come; or no more replies are wanted.
  Bool closed_ = false;
  Bool stopped_ = false;
  /// A thread is with the sink. It looks for more when it is back.
  Bool delivering_ = false;
  /// Of the thread that is with the sink. Never grows: a reply that could not be handed out for
  /// want of memory would be lost.
  std::vector<JSON::Reply> due_;
  std::vector<std::thread> threads_;
};

}  // namespace Keelgate::CLI
