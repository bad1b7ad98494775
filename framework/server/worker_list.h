// SPDX-License-Identifier: Apache-2.0
/// The workers of a zygote: those that are forked for a message, and those that are rewound instead
/// of being forked; when another of these is worth it, and when it is over with one of them.
///
/// For one thread, the zygote's.
#pragma once

#include "framework/server/rewindable_worker.h"

#include <keelgate/values.h>

#include <sys/resource.h>
#include <sys/types.h>

#include <vector>

namespace Keelgate {

class WorkerList {
 public:
  /// `cpuSeconds`: what a message may have of the processor.
  explicit WorkerList(std::uint64_t cpuSeconds = 0) noexcept : cpuSeconds_(cpuSeconds) {}

  /// The limit of a worker that each of its messages has as much of as it would have in a fork.
  [[nodiscard]] std::uint64_t cpuLimit() const noexcept { return 2 * cpuSeconds_ + 2; }

  /// Gives a channel to a worker that waits for one, which owns it then. False where none does.
  bool give(std::uint32_t slot, int channel);

  /// A fork for the messages of a slot.
  void add(std::uint32_t slot, pid_t process) {
    members_.push_back({.process = process, .slot = slot, .rewindable = {}});
  }

  /// Called for each message that had to be forked for: whether to fork one to be rewound as well.
  bool isAnotherWorthIt();
  /// Such a fork, or -1 where it failed.
  void addRewindable(pid_t process);
  /// Whether none is rewound, and it has turned out that the machine does not let it.
  [[nodiscard]] bool isRewindingHopeless() const noexcept {
    return failures_ >= maximumFailures && rewindableCount() == 0;
  }

  /// What the one that is getting ready waits for, or -1; and what to do when it is readable.
  [[nodiscard]] int startStep() const noexcept;
  void takeStep();

  /// The process that has a slot, or 0.
  [[nodiscard]] pid_t processOf(std::uint32_t slot) const noexcept;

  /// How a message ended, as wait4 would have told it of a fork.
  struct End {
    std::uint32_t slot;
    int status;
    rusage used;
  };
  /// Takes what wait4 has given. Nothing where nobody need be told.
  Optional<End> note(pid_t process, int status, const rusage& used);

 private:
  static constexpr unsigned maximumFailures = 3;

  struct Member {
    /// Until it is reaped: its number cannot be another's before that.
    pid_t process;
    /// Whoever has none is rewindable, and on its way back, or waits.
    Optional<std::uint32_t> slot;
    Optional<RewindableWorker> rewindable;
    rusage usedBefore{};
  };

  [[nodiscard]] std::size_t rewindableCount() const noexcept;
  Optional<End> noteStop(Member& member, int status, const rusage& used);
  [[nodiscard]] bool isTired(const rusage& used) const noexcept;
  static void throwAway(const Member& member) noexcept;

  std::uint64_t cpuSeconds_;
  std::vector<Member> members_;
  unsigned missed_ = 0;
  unsigned failures_ = 0;
};

}  // namespace Keelgate
