// SPDX-License-Identifier: Apache-2.0
#include "framework/server/worker_list.h"

#include <sys/ptrace.h>
#include <sys/time.h>
#include <sys/wait.h>

#include <algorithm>
#include <csignal>

namespace Keelgate {

namespace {

/// A worker that can be rewound costs as much as a few forks. So it is made for those who send one
/// message after the other, and a single one pays nothing for it.
constexpr unsigned missesPerWorker = 16;

/// Each takes five descriptors. Whoever has more messages in work has the others forked.
constexpr std::size_t maximumWorkers = 64;

rusage difference(const rusage& now, const rusage& before) {
  rusage used = now;
  timersub(&now.ru_utime, &before.ru_utime, &used.ru_utime);
  timersub(&now.ru_stime, &before.ru_stime, &used.ru_stime);
  return used;
}

bool isAtEnd(int status) {
  return status >> 8 == (SIGTRAP | PTRACE_EVENT_SECCOMP << 8);
}

}  // namespace

bool WorkerList::give(std::uint32_t slot, int channel) {
  for (Member& member : members_) {
    if (member.slot || !member.rewindable->isReady() || !member.rewindable->give(channel)) continue;
    member.slot = slot;
    return true;
  }
  return false;
}

bool WorkerList::isAnotherWorthIt() {
  const bool isOneStarting = std::ranges::any_of(
      members_, [](const Member& m) { return m.rewindable && !m.rewindable->isReady(); });
  if (isOneStarting || failures_ >= maximumFailures || rewindableCount() >= maximumWorkers) {
    return false;
  }
  missed_ = (missed_ + 1) % missesPerWorker;
  return missed_ == 0;
}

void WorkerList::addRewindable(pid_t process) {
  if (process < 0) return;
  members_.push_back({.process = process, .slot = {}, .rewindable = RewindableWorker(process)});
}

std::size_t WorkerList::rewindableCount() const noexcept {
  return static_cast<std::size_t>(std::count_if(
      members_.begin(), members_.end(), [](const Member& m) { return m.rewindable.has_value(); }));
}

int WorkerList::startStep() const noexcept {
  for (const Member& member : members_) {
    const int step = member.rewindable ? member.rewindable->startStep() : -1;
    if (step >= 0) return step;
  }
  return -1;
}

void WorkerList::takeStep() {
  for (Member& member : members_) {
    if (!member.rewindable || member.rewindable->startStep() < 0) continue;
    if (!member.rewindable->takeStep()) throwAway(member);
    return;
  }
}

pid_t WorkerList::processOf(std::uint32_t slot) const noexcept {
  for (const Member& member : members_) {
    if (member.slot == slot) return member.process;
  }
  return 0;
}

Optional<WorkerList::End> WorkerList::note(pid_t process, int status, const rusage& used) {
  const auto member = std::ranges::find(members_, process, &Member::process);
  // An orphan, which the first process of a namespace inherits.
  if (member == members_.end()) return std::nullopt;
  const auto& rewindable = member->rewindable;
  if (rewindable && WIFSTOPPED(status)) return noteStop(*member, status, used);
  Optional<End> end;
  if (member->slot) {
    end = {.slot = *member->slot, .status = status, .used = difference(used, member->usedBefore)};
  }
  if (rewindable && !rewindable->isReady()) {
    ++failures_;
    RewindableWorker::forgetHandedOver();
  }
  members_.erase(member);
  return end;
}

Optional<WorkerList::End> WorkerList::noteStop(Member& member, int status, const rusage& used) {
  RewindableWorker& worker = *member.rewindable;
  if (!worker.isReady()) {
    if (!worker.keep() || !worker.goOn()) throwAway(member);
    return std::nullopt;
  }
  if (!member.slot) {
    // Something that nobody here has sent.
    throwAway(member);
    return std::nullopt;
  }
  if (!isAtEnd(status)) {
    // What comes to it comes to it as without a tracer, and it is let die of it. A stop is for
    // good.
    if (WSTOPSIG(status) != SIGSTOP && !worker.goOn(WSTOPSIG(status))) throwAway(member);
    return std::nullopt;
  }
  const End end{.slot = *member.slot, .status = 0, .used = difference(used, member.usedBefore)};
  member.slot.reset();
  member.usedBefore = used;
  worker.hangUp();
  if (isTired(used) || !worker.rewind() || !worker.goOn()) throwAway(member);
  return end;
}

/// What is left then is what a message may have, and no less than that.
bool WorkerList::isTired(const rusage& used) const noexcept {
  const auto seconds = used.ru_utime.tv_sec + used.ru_stime.tv_sec;
  return static_cast<std::uint64_t>(seconds) >= cpuSeconds_;
}

/// Its end is noticed like any other, and nobody is told of it who knows of its end already.
void WorkerList::throwAway(const Member& member) noexcept {
  kill(member.process, SIGKILL);
}

}  // namespace Keelgate
