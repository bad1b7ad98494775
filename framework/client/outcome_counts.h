// SPDX-License-Identifier: Apache-2.0
/// What has become of messages, in numbers: for a client's statistics, and for what the command
/// says of a run.
#pragma once

#include <keelgate/client.h>

#include <array>
#include <atomic>

namespace Keelgate {

/// All members may be called from any thread.
class OutcomeCounts {
 public:
  void countRecord() noexcept { ++records_; }
  void countRejection() noexcept { ++rejections_; }
  void count(HostError::Reason reason) noexcept { ++hostErrors_[static_cast<std::size_t>(reason)]; }

  [[nodiscard]] UInt64 of(HostError::Reason reason) const noexcept {
    return hostErrors_[static_cast<std::size_t>(reason)];
  }
  [[nodiscard]] Statistics read() const noexcept {
    using Reason = HostError::Reason;
    Statistics all{.messages = 0,
                   .records = records_,
                   .rejections = rejections_,
                   .crashed = of(Reason::crashed),
                   .timedOut = of(Reason::timedOut),
                   .messageTooLarge = of(Reason::messageTooLarge),
                   .resourcesExhausted = of(Reason::resourcesExhausted),
                   .protocolViolations = of(Reason::protocolViolation),
                   .startFailed = of(Reason::startFailed)};
    all.messages = all.records + all.rejections + all.crashed + all.timedOut + all.messageTooLarge +
                   all.resourcesExhausted + all.protocolViolations + all.startFailed;
    return all;
  }

 private:
  std::atomic<UInt64> records_ = 0;
  std::atomic<UInt64> rejections_ = 0;
  /// By the number of the reason; they have no gaps.
  std::array<std::atomic<UInt64>, casesOf<HostError::Reason>.size()> hostErrors_{};
};

}  // namespace Keelgate
