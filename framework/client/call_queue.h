// SPDX-License-Identifier: Apache-2.0
/// Many calls that one thread at a time drives: so many are in work, the others wait here.
#pragma once

#include "framework/client/call.h"

#include <atomic>
#include <deque>
#include <list>
#include <memory>
#include <mutex>

namespace Keelgate {

/// A message in a queue, whatever record it asks for.
class Task {
 public:
  virtual ~Task() = default;
  /// As Call::advance; it begins when it is first called.
  virtual Optional<Wait> advance() noexcept = 0;
  /// Tells whoever asked for it. Nothing is done with it afterwards.
  virtual void complete() = 0;
  /// When advance() ends it even if it has not begun.
  [[nodiscard]] virtual Deadline deadline() const noexcept = 0;
};

/// `push`, `isEmpty` and `count` may be called from any thread at any time, the others by one at a
/// time.
class CallQueue {
 public:
  /// So many tasks are in work at a time.
  explicit CallQueue(std::size_t window) : window_(window) {}

  void push(std::unique_ptr<Task> task);
  [[nodiscard]] bool isEmpty() const noexcept { return count_ == 0; }
  /// All that has not been completed.
  [[nodiscard]] std::size_t count() const noexcept { return count_; }

  /// Advances what can go on, and completes what is done, in the order in which that happens; if
  /// it `mayWait` for that, it does. What a completion throws comes through, and the next call
  /// goes on with the others.
  void run(bool mayWait);

  /// Calls `visitor(const Wait&)` for all that is in work.
  template <class Visitor>
  void eachWait(Visitor visitor) const {
    for (const Running& running : running_) visitor(running.wait);
  }
  /// When something is to be done, whatever happens until then.
  [[nodiscard]] Deadline nextTime() const;

 private:
  struct Running {
    std::unique_ptr<Task> task;
    /// Over from the start.
    Wait wait{};
  };

  void begin();
  void advanceReady(bool mayWait);

  const std::size_t window_;
  std::atomic<std::size_t> count_ = 0;
  std::list<Running> running_;
  std::deque<std::unique_ptr<Task>> done_;

  mutable std::mutex mutex_;
  std::deque<std::unique_ptr<Task>> waiting_;
  /// The earliest deadline in `waiting_`, or earlier.
  Deadline earliest_ = Deadline::max();
};

}  // namespace Keelgate
