// SPDX-License-Identifier: Apache-2.0
/// The zygote never reads a message, so it is believed more than a worker is, but not blindly: a
/// frame that it should not have sent makes the service a lost one.
#include "framework/client/service_process.h"

#include "framework/contracts/layers.h"
#include "framework/contracts/memory_budget.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/control_frames.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include <algorithm>
#include <cerrno>
#include <csignal>

namespace Keelgate {

using Protocol::ControlFrame;
using Protocol::ControlKind;
using Protocol::makeControlFrame;
using Protocol::noDescriptor;
using Protocol::Transfer;
using std::chrono::milliseconds;

namespace {

/// An honest worker is gone so long after its last answer.
constexpr milliseconds leavePatience{10};

/// A launcher gets so long to collect what it leaves: on a crowded machine it needs some. At the
/// end of a client, which has promised to be quick, it gets less.
constexpr milliseconds collectPatience{300};
constexpr milliseconds lastPatience{80};
/// One that was killed is gone when the kernel says so.
constexpr milliseconds killedPatience{100};

/// Sends a frame of a service that may have too little room for it, as long as the deadline allows.
bool sendFrame(int control, const ControlFrame& frame, int descriptor, Deadline deadline) noexcept {
  for (;;) {
    const Transfer sent = Protocol::sendControl(control, frame, descriptor, Protocol::Waiting::no);
    if (sent != Transfer::wouldBlock) return sent == Transfer::complete;
    if (waitFor(control, POLLOUT, deadline) == 0) return false;
  }
}

}  // namespace

ServiceProcess::ServiceProcess(const ServiceSettings& settings, DescriptorBook& book,
                               Deadline deadline)
    : book_(book), slots_(settings.maximumWorkers) {
  handles_ = settings.socket.empty() ? launchService(settings.path, book)
                                     : connectService(settings.socket, book, deadline);
  try {
    shakeHands(settings, deadline);
  } catch (...) {
    end(milliseconds(0));
    throw;
  }
}

ServiceProcess::~ServiceProcess() {
  end(milliseconds(0));
}

void ServiceProcess::shakeHands(const ServiceSettings& settings, Deadline deadline) {
  // Said once and for all workers: what bounds a worker is fixed before any message is known.
  const ControlFrame hello = makeControlFrame(
      ControlKind::hello, 0, {settings.messagesPerWorker, settings.cpuSecondsPerWorker});
  ControlFrame answer;
  const int control = handles_.control.get();
  // A service that has already refused takes no hello, and its reason is waiting to be read.
  static_cast<void>(sendFrame(control, hello, noDescriptor, deadline));
  if (waitFor(control, POLLIN, deadline) == 0) failToStart(true);
  if (Protocol::receiveControl(control, answer, Protocol::Waiting::no) != Transfer::complete) {
    failToStart(false);
  }
  if (answer.kind == ControlKind::refused) {
    throw StartFailure(
        startFailureSentence(StartStep{answer.numbers[0]}, static_cast<int>(answer.numbers[1])),
        false);
  }
  if (answer.kind != ControlKind::ready) failToStart(false);
  layers_ = answer.numbers[0];
  version_ = answer.numbers[1];
  // Records travel as they stand in the schema of one build: another's would be misread.
  if (version_ != Protocol::ownVersion()) {
    throw StartFailure("The service is of version " + Protocol::versionText(version_) +
                           " and its client of " + Protocol::versionText(Protocol::ownVersion()) +
                           ": install both from one build",
                       false);
  }
#ifndef KEELGATE_UNSEALED
  // A service that was built for a sanitizer has no seal, and says so.
  if ((layers_ & requiredLayers) != requiredLayers) {
    throw StartFailure("The service was built without its seal: install a release build of it",
                       false);
  }
#endif
  const String missing = missingLayersLine(layers_);
  if (settings.requireLayers && !missing.empty()) {
    throw StartFailure(missing +
                           ", and all layers are required: run it where the kernel and the "
                           "container's profile allow them, or don't require them",
                       false);
  }
}

void ServiceProcess::failToStart(bool late) {
  throw StartFailure(late ? "The service did not get ready in time: the machine may be overloaded"
                          : "The service ended, or said something unknown, while it was starting: "
                            "check that it is a VespKeelgateService of this build",
                     true);
}

Optional<ServiceProcess::Forked> ServiceProcess::fork(std::uint64_t longestMessage,
                                                      Deadline deadline) {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
    throw shortage("No channel for a worker could be made", errno);
  }
  Descriptor ours(book_, ends[0]);
  // In the book as well: a copy in a forked child would keep the worker's channel open.
  const Descriptor theirs(book_, ends[1]);
  const Optional<std::uint32_t> slot = claimSlot(deadline);
  if (!slot) return std::nullopt;
  const ControlFrame frame = makeControlFrame(ControlKind::fork, *slot, {longestMessage});
  // A zygote that takes no frame for so long forks for nobody else either.
  if (!sendFrame(handles_.control.get(), frame, theirs.get(), deadline)) {
    lose();
    return std::nullopt;
  }
  return Forked{.slot = *slot,
                .channel = std::move(ours),
                .heap = memoryBudget(std::max(longestMessage, shortMessage))};
}

Optional<std::uint32_t> ServiceProcess::claimSlot(Deadline deadline) {
  Lock lock(mutex_);
  const auto free = [&] {
    return std::find_if(slots_.begin(), slots_.end(),
                        [](const Slot& slot) { return slot.phase == Slot::Phase::free; });
  };
  while (free() == slots_.end() && !isLost() && Clock::now() < deadline) {
    // Workers that have answered and stay: an honest one ends at once.
    for (std::uint32_t i = 0; i < slots_.size(); ++i) {
      if (slots_[i].phase == Slot::Phase::released) killSlot(i);
    }
    readUntil(lock, std::min(deadlineAfter(killPatience), deadline),
              [&] { return free() != slots_.end(); });
    const Deadline longAgo = Clock::now() - killPatience;
    const bool stuck = std::any_of(slots_.begin(), slots_.end(), [&](const Slot& slot) {
      return slot.phase == Slot::Phase::released && slot.killed && !slot.confirmed &&
             slot.since < longAgo;
    });
    if (stuck) destroy();
  }
  const auto slot = free();
  if (slot == slots_.end() || isLost()) return std::nullopt;
  *slot = Slot{.phase = Slot::Phase::running};
  return static_cast<std::uint32_t>(slot - slots_.begin());
}

void ServiceProcess::killSlot(std::uint32_t slot) noexcept {
  if (slots_[slot].phase == Slot::Phase::ended || slots_[slot].killed) return;
  // Not waited for: if the zygote does not even read, its launcher is killed before long.
  slots_[slot].killed = sendFrame(handles_.control.get(), makeControlFrame(ControlKind::kill, slot),
                                  noDescriptor, Clock::now());
  slots_[slot].since = Clock::now();
}

void ServiceProcess::kill(std::uint32_t slot) noexcept {
  const std::lock_guard lock(mutex_);
  killSlot(slot);
}

bool ServiceProcess::awaitKill(std::uint32_t slot, Deadline deadline) {
  Lock lock(mutex_);
  const auto heard = [&] {
    return slots_[slot].confirmed || slots_[slot].phase == Slot::Phase::ended;
  };
  readUntil(lock, deadline, heard);
  return heard();
}

Optional<ServiceProcess::Exit> ServiceProcess::awaitExit(std::uint32_t slot, Deadline deadline) {
  Lock lock(mutex_);
  const auto ended = [&] {
    return slots_[slot].phase == Slot::Phase::ended;
  };
  readUntil(lock, deadline, ended);
  if (!ended()) return std::nullopt;
  return slots_[slot].exit;
}

void ServiceProcess::release(std::uint32_t slot) noexcept {
  const std::lock_guard lock(mutex_);
  Slot& its = slots_[slot];
  its.phase = its.phase == Slot::Phase::ended ? Slot::Phase::free : Slot::Phase::released;
  its.since = Clock::now();
}

void ServiceProcess::collect() noexcept {
  const std::lock_guard lock(mutex_);
  if (!reading_) readAll();
  // One that was taken over may have answered and stay, to use the processor and its memory.
  const Deadline longAgo = Clock::now() - leavePatience;
  for (std::uint32_t i = 0; i < slots_.size(); ++i) {
    if (slots_[i].phase == Slot::Phase::released && slots_[i].since < longAgo) killSlot(i);
  }
}

// The first thread that finds nobody reading reads for all; when it has what it came for, it wakes
// the others, and one of them takes its place.
template <class Condition>
void ServiceProcess::readUntil(Lock& lock, Deadline deadline, Condition condition) {
  if (!reading_) readAll();
  while (!condition() && !isLost() && Clock::now() < deadline) {
    if (reading_) {
      news_.wait_until(lock, deadline);
      continue;
    }
    reading_ = true;
    lock.unlock();
    waitFor(handles_.control.get(), POLLIN, deadline);
    lock.lock();
    readAll();
    reading_ = false;
    news_.notify_all();
  }
}

void ServiceProcess::readAll() noexcept {
  for (ControlFrame frame; !isLost();) {
    switch (Protocol::receiveControl(handles_.control.get(), frame, Protocol::Waiting::no)) {
      case Transfer::wouldBlock:
        return;
      case Transfer::complete:
        note(frame);
        break;
      case Transfer::ended:
      case Transfer::malformed:
        lose();
        break;
    }
  }
}

void ServiceProcess::note(const ControlFrame& frame) noexcept {
  // The slot comes from outside and is a number to be checked like any other.
  Slot none;
  Slot& slot = frame.slot < slots_.size() ? slots_[frame.slot] : none;
  const bool alive = slot.phase == Slot::Phase::running || slot.phase == Slot::Phase::released;
  if (alive && frame.kind == ControlKind::exit) {
    noteExit(slot, frame);
  } else if (alive && frame.kind == ControlKind::killed && slot.killed && !slot.confirmed) {
    slot.confirmed = true;
  } else {
    lose();
  }
}

void ServiceProcess::noteExit(Slot& slot, const ControlFrame& frame) noexcept {
  slot.exit = {.status = static_cast<int>(frame.numbers[0]), .neverStarted = frame.numbers[3] != 0};
  slot.phase = slot.phase == Slot::Phase::released ? Slot::Phase::free : Slot::Phase::ended;
  const int signal = WIFSIGNALED(slot.exit.status) ? WTERMSIG(slot.exit.status) : 0;
  // Ending for want of processor time, or by our own hand, shows nothing of the address layout. Any
  // other signal may be somebody's miss, and the next try must not meet the same layout.
  const bool expected = signal == 0 || signal == SIGXCPU || (signal == SIGKILL && slot.killed);
  State running = State::running;
  // Exchanged: a lost service stays lost.
  if (!expected) state_.compare_exchange_strong(running, State::retired);
}

void ServiceProcess::lose() noexcept {
  state_ = State::lost;
}

void ServiceProcess::destroy() noexcept {
  lose();
  if (handles_.launcher) askToEnd(handles_.launcher);
  // Ends the channel in every process that has a copy of it, and so whoever waits on it here.
  shutdown(handles_.control.get(), SHUT_RDWR);
}

// The zygote ends when its channel does, and its workers with it; the launcher is last.
void ServiceProcess::end(milliseconds patience) noexcept {
  if (!handles_.control) return;
  lose();
  shutdown(handles_.control.get(), SHUT_RDWR);
  handles_.control.close();
  if (!handles_.launcher) return;
  const auto hasEnded = [&](milliseconds within) {
    return waitFor(handles_.launcher.get(), POLLIN, deadlineAfter(within)) != 0;
  };
  if (!hasEnded(patience)) {
    // It kills its zygote and waits for all that it leaves. If the launcher were killed, these
    // would be left to the application where that is what collects orphans: as pid 1 of a
    // container.
    askToEnd(handles_.launcher);
    if (!hasEnded(patience.count() == 0 ? collectPatience : lastPatience)) {
      killLauncher(handles_.launcher);
      hasEnded(patience.count() == 0 ? killedPatience : lastPatience / 4);
    }
  }
  reapLauncher(handles_.launcher);
  handles_.launcher.close();
}

}  // namespace Keelgate
