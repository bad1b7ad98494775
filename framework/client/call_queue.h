// SPDX-License-Identifier: Apache-2.0
/// Many messages that one thread at a time drives: so many are in work, the others wait here. Where
/// workers are used again, short ones go to them many at a time.
#pragma once

#include "framework/client/pipeline.h"

#include <atomic>
#include <deque>
#include <mutex>

namespace Keelgate {

/// `push`, `isEmpty` and `count` may be called from any thread at any time, the others by one at a
/// time.
class CallQueue {
 public:
  explicit CallQueue(Pool& pool);

  void push(CallList calls);
  [[nodiscard]] bool isEmpty() const noexcept { return count_ == 0; }
  /// All that has not been completed.
  [[nodiscard]] std::size_t count() const noexcept { return count_; }
  /// As many as can be in work, and some to follow them.
  [[nodiscard]] std::size_t window() const noexcept {
    return window_ + 2 * Pipeline::capacity * pipelines_.size();
  }

  /// Advances what can go on, and completes what is done, in the order in which that happens; if
  /// it `mayWait` for that, it does. What a completion throws comes through, and the next call
  /// goes on with the others.
  void run(bool mayWait);

  /// Calls `visitor(const Wait&)` for all that is in work.
  template <class Visitor>
  void eachWait(Visitor visitor) const {
    for (const Call& call : running_) visitor(call.wait());
    for (const Pipeline& pipeline : pipelines_) {
      if (pipeline.wait()) visitor(*pipeline.wait());
    }
  }
  /// When something is to be done, whatever happens until then.
  [[nodiscard]] Deadline nextTime() const;

 private:
  void begin();
  [[nodiscard]] bool mayBegin() const noexcept;
  Pipeline* freePipeline() noexcept;
  void advanceReady(bool mayWait);
  void advancePipelines() noexcept;

  const std::size_t window_;
  std::atomic<std::size_t> count_ = 0;
  CallList running_;
  std::deque<Pipeline> pipelines_;
  CallList done_;

  mutable std::mutex mutex_;
  CallList waiting_;
  /// The earliest deadline in `waiting_`, or earlier.
  Deadline earliest_ = Deadline::max();
};

}  // namespace Keelgate
