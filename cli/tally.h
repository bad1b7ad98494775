// SPDX-License-Identifier: Apache-2.0
/// What became of the messages of one run: the sum-up for people, the counters for monitoring.
#pragma once

#include "framework/client/outcome_counts.h"
#include "framework/json/reply.h"

#include <atomic>
#include <chrono>

namespace Keelgate::CLI {

/// May be used from many threads at once. Throws nothing but std::bad_alloc.
class Tally {
 public:
  void count(const JSON::Reply& reply) noexcept;

  /// "1,001 messages, 2 rejected, 1 crashed, 1 timed out, 3 failed, 0.41 s": what is zero is left
  /// out, and what was never a message is not counted.
  [[nodiscard]] String sentence() const;

  /// In the text format of Prometheus.
  [[nodiscard]] String metrics() const;

 private:
  OutcomeCounts messages_;
  std::atomic<UInt64> unusable_ = 0;
  std::atomic<UInt64> bytes_ = 0;
  const std::chrono::steady_clock::time_point begin_ = std::chrono::steady_clock::now();
};

}  // namespace Keelgate::CLI
