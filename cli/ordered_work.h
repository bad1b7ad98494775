// SPDX-License-Identifier: Apache-2.0
/// Many messages in work at once, their replies in the order in which they came.
///
/// Each thread takes a job from the source, does it, and goes back for the next: nobody hands work
/// to anybody, so nobody has to be woken for it. Whichever thread completes the oldest reply gives
/// all that are due to the sink. Nothing is held back: a reply whose predecessors are out goes out.
///
/// What waits is bounded in number and in bytes, so that an endless input takes no endless memory,
/// and neither does one slow message before many that have long replies: while the window is full
/// no job is taken.
#pragma once

#include "framework/json/reply.h"

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <mutex>
#include <vector>

namespace Keelgate::CLI {

class OrderedWork {
 public:
  struct Job {
    /// The next of its replies, or nothing behind the last. Called by one thread at a time.
    std::function<Optional<JSON::Reply>()> next;
    /// The number of bytes that it keeps in memory.
    std::size_t weight = 0;
  };
  /// The next job, for which it may wait, or nothing at the end. Called from any of the threads,
  /// never from two at once. It must not throw.
  using Source = std::function<Optional<Job>()>;
  /// Takes the replies that are due; the last of its job may be among them. Called from any of the
  /// threads, never from two at once. False ends all work: nobody reads any more, or there is no
  /// service to ask. It must not throw.
  using Sink = std::function<Bool(const std::vector<JSON::Reply>& due, Bool jobEnded)>;

  explicit OrderedWork(Sink sink);
  ~OrderedWork();
  OrderedWork(const OrderedWork&) = delete;
  OrderedWork& operator=(const OrderedWork&) = delete;

  /// Works with so many threads, the calling one included, or with as many as there can be, until
  /// every reply has gone to the sink or work has ended. Once. Throws std::bad_alloc when there was
  /// no memory for a job, which ends all work.
  void run(std::size_t threads, Source source);

  /// Becomes readable when work has ended, for a poll beside the input.
  [[nodiscard]] int endedDescriptor() const { return ended_; }

 private:
  /// A job in work, or complete and waiting for its turn.
  struct Slot {
    Job job;
    /// Those that the sink has not had.
    std::vector<JSON::Reply> replies = {};
    Bool complete = false;
  };

  void work();
  Slot* take();
  /// False behind the last reply, or when no more are wanted; the slot may be gone then.
  Bool add(Slot& slot, Optional<JSON::Reply> reply);
  /// Hands out what is due. The lock is given up while the sink works.
  void deliver(std::unique_lock<std::mutex>& lock);
  void end();

  const Sink sink_;
  Source source_;
  int ended_;
  /// How many slots there may be.
  std::size_t capacity_ = 0;

  /// Held by the thread that waits for the source.
  std::mutex taking_;
  /// Guards everything below.
  std::mutex mutex_;
  /// There may be room in the window.
  std::condition_variable room_;
  /// From the oldest job whose replies are not all out. References to slots survive additions and
  /// removals at the ends.
  std::deque<Slot> slots_;
  /// Of the slots and of the replies that the sink has: requests, then replies, in bytes.
  std::size_t weight_ = 0;
  /// No more jobs come; or no more replies are wanted.
  Bool isClosed_ = false;
  Bool isOver_ = false;
  Bool hadNoMemory_ = false;
  /// A thread is with the sink. It looks for more when it is back.
  Bool delivering_ = false;
};

}  // namespace Keelgate::CLI
