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
#include <initializer_list>

namespace Keelgate {

using Protocol::ControlFrame;
using Protocol::ControlKind;
using Protocol::makeControlFrame;
using Protocol::noDescriptor;
using Protocol::Transfer;
using Protocol::Waiting;
using std::chrono::milliseconds;

namespace {

/// An honest worker is gone so long after its last answer; the slots are looked at as often.
constexpr milliseconds leavePatience{4};

/// Two may wait for the same news, and the one who reads it does not tell the other; and slots come
/// free with time.
constexpr milliseconds newsInterval{4};

/// After one that was not gone by then nobody is waited for who holds the last slot.
constexpr milliseconds impatience{100};

/// Ending of its own will, or by our hand, shows nothing of the address layout. Anything else may
/// be somebody's miss, and the next try must not meet the same layout. (One that never started has
/// status 0.)
bool isAbnormal(int status, bool killed) noexcept {
  if (WIFEXITED(status)) return WEXITSTATUS(status) != 0;
  return !(killed && WTERMSIG(status) == SIGKILL);
}

/// A channel for long messages holds as much as the system lets it, so that both sides are woken
/// less often for each.
void widen(std::initializer_list<int> ends) noexcept {
  constexpr int most = 1 << 20;
  for (const int end : ends) setsockopt(end, SOL_SOCKET, SO_SNDBUF, &most, sizeof most);
}

const char* silentSentence(bool activated) {
  return activated
             ? "The activated service ended at once: 'journalctl -u keelgate@*' says why, and "
               "'systemctl status keelgate.socket' whether its connections are used up "
               "(MaxConnections)"
             : "The service ended, or said something unknown, while it was starting: check that it "
               "is a VespKeelgateService of this build";
}

}  // namespace

ServiceProcess::ServiceProcess(const ServiceSettings& settings, DescriptorRegistry& registry)
    : settings_(settings), registry_(registry), slots_(settings.maximumWorkers) {
  handles_ = settings.socket.empty()
                 ? launchService(settings.path, registry)
                 : connectService(settings.socket, settings.socketUser, registry);
  // Said once and for all workers: what bounds a worker is fixed before any message is known. A
  // service that has already refused takes no hello, and its reason is waiting to be read.
  const ControlFrame hello = makeControlFrame(
      ControlKind::hello, 0,
      {settings.messagesPerWorker, settings.cpuSecondsPerWorker, settings.forks ? 1U : 0U});
  static_cast<void>(
      Protocol::sendControl(handles_.control.get(), hello, noDescriptor, Waiting::no));
}

ServiceProcess::~ServiceProcess() {
  while (!end({})) waitFor(nextStep());
}

Optional<StartFailure> ServiceProcess::startFailure() const {
  const std::lock_guard lock(mutex_);
  return startFailure_;
}

void ServiceProcess::readNews(Deadline now) noexcept {
  const std::lock_guard lock(mutex_);
  for (ControlFrame frame; state_ != State::lost;) {
    switch (Protocol::receiveControl(handles_.control.get(), frame, Waiting::no)) {
      case Transfer::complete:
        noteFrame(frame);
        continue;
      case Transfer::wouldBlock:
        break;
      case Transfer::ended:
      case Transfer::malformed:
        if (state_ == State::starting) {
          failToStart({silentSentence(!settings_.socket.empty()), true});
        }
        lose();
        break;
    }
    break;
  }
  if (state_ == State::starting && now >= startedAt_ + startPatience) {
    failToStart({"The service did not get ready in time: the machine may be overloaded", true});
  }
  if (now < lastLook_ + leavePatience) return;
  lastLook_ = now;
  // One that was taken over may have answered and stay, to use the processor and its memory.
  killAll(SlotState::overdue, SlotState::stayed);
  for (Slot& slot : slots_) {
    if (slot.state == SlotState::leaving) slot.state = SlotState::overdue;
  }
}

Wait ServiceProcess::waitForNews(Deadline until) const noexcept {
  return {.descriptor = handles_.control.get(),
          .events = POLLIN,
          .until = std::min(until, Clock::now() + newsInterval)};
}

void ServiceProcess::noteFrame(const ControlFrame& frame) noexcept {
  if (state_ == State::starting) {
    try {
      noteAnswerToHello(frame);
    } catch (const std::bad_alloc&) {
      lose();
    }
    return;
  }
  // The slot comes from outside and is a number to be checked like any other.
  const bool known = frame.slot < slots_.size() && slots_[frame.slot].state != SlotState::free &&
                     slots_[frame.slot].state != SlotState::ended;
  if (!known || frame.kind != ControlKind::exit) {
    lose();
    return;
  }
  noteExit(slots_[frame.slot],
           {.status = static_cast<int>(frame.numbers[0]), .neverStarted = frame.numbers[3] != 0});
}

void ServiceProcess::noteExit(Slot& slot, const Exit& exit) noexcept {
  const bool stayed = slot.state == SlotState::stayed;
  if (isAbnormal(exit.status, stayed || slot.state == SlotState::killed)) retire();
  // Others of its sender may hold more slots.
  if (stayed && WIFSIGNALED(exit.status)) impatientUntil_ = Clock::now() + impatience;
  slot = {.state = slot.state == SlotState::held ? SlotState::ended : SlotState::free,
          .exit = exit};
}

void ServiceProcess::noteAnswerToHello(const ControlFrame& frame) {
  if (frame.kind == ControlKind::refused) {
    failToStart(
        {startFailureSentence(StartStep{frame.numbers[0]}, static_cast<int>(frame.numbers[1])),
         false});
    return;
  }
  if (frame.kind != ControlKind::ready) {
    failToStart({silentSentence(!settings_.socket.empty()), true});
    return;
  }
  layers_ = frame.numbers[0];
  version_ = frame.numbers[1];
  const String missing = missingLayersLine(layers_);
  // Records travel as they stand in the schema of one build: another's would be misread.
  if (version_ != Protocol::ownVersion()) {
    failToStart({"The service is of version " + Protocol::versionText(version_) +
                     " and its client of " + Protocol::versionText(Protocol::ownVersion()) +
                     ": install both from one build",
                 false});
#ifndef KEELGATE_UNSEALED
    // A service that was built for a sanitizer has no seal, and says so.
  } else if ((layers_ & requiredLayers) != requiredLayers) {
    failToStart({"The service was built without its seal: install a release build of it", false});
#endif
  } else if (settings_.requireLayers && !missing.empty()) {
    failToStart({missing +
                     ", and all layers are required: run it where the kernel and the container's "
                     "profile allow them, or don't require them",
                 false});
  } else {
    state_ = State::running;
  }
}

void ServiceProcess::failToStart(StartFailure failure) {
  startFailure_ = std::move(failure);
  lose();
}

Optional<ServiceProcess::Forked> ServiceProcess::fork(std::uint64_t longestMessage) {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
    throw shortage("No channel for a worker could be made", errno);
  }
  Descriptor ours(registry_, ends[0]);
  // Registered as well: a copy in a forked child would keep the worker's channel open.
  const Descriptor theirs(registry_, ends[1]);
  if (!ours || !theirs) throw shortage("No channel for a worker could be made", errno);
  if (longestMessage > shortMessage) widen({ours.get(), theirs.get()});
  const std::lock_guard lock(mutex_);
  const auto free = std::find_if(slots_.begin(), slots_.end(),
                                 [](const Slot& slot) { return slot.state == SlotState::free; });
  if (state_ == State::lost) return std::nullopt;
  if (free == slots_.end()) {
    // Those that have answered are on their way, and the processor is theirs while the caller
    // waits: one that is killed now cannot be rewound.
    if (Clock::now() < impatientUntil_) killAll(SlotState::leaving, SlotState::killed);
    return std::nullopt;
  }
  const auto slot = static_cast<std::uint32_t>(free - slots_.begin());
  const ControlFrame frame = makeControlFrame(ControlKind::fork, slot, {longestMessage});
  switch (Protocol::sendControl(handles_.control.get(), frame, theirs.get(), Waiting::no)) {
    case Transfer::complete:
      free->state = SlotState::held;
      return Forked{.slot = slot, .channel = std::move(ours)};
    case Transfer::wouldBlock:
      return std::nullopt;
    case Transfer::ended:
    case Transfer::malformed:
      break;
  }
  lose();
  return std::nullopt;
}

Optional<ServiceProcess::Exit> ServiceProcess::exitOf(std::uint32_t slot) const {
  const std::lock_guard lock(mutex_);
  if (slots_[slot].state != SlotState::ended) return std::nullopt;
  return slots_[slot].exit;
}

void ServiceProcess::release(std::uint32_t slot, Leaving how) noexcept {
  const std::lock_guard lock(mutex_);
  SlotState& state = slots_[slot].state;
  if (state == SlotState::ended) {
    state = SlotState::free;
  } else if (how == Leaving::byItself) {
    state = SlotState::leaving;
  } else {
    // Where the zygote has no room for the frame it is tried again at the next look.
    state = sendKill(slot) ? SlotState::killed : SlotState::overdue;
  }
}

void ServiceProcess::killAll(SlotState from, SlotState to) noexcept {
  for (std::uint32_t i = 0; i < slots_.size(); ++i) {
    if (slots_[i].state == from && sendKill(i)) slots_[i].state = to;
  }
}

bool ServiceProcess::sendKill(std::uint32_t slot) noexcept {
  return Protocol::sendControl(handles_.control.get(), makeControlFrame(ControlKind::kill, slot),
                               noDescriptor, Waiting::no) == Transfer::complete;
}

void ServiceProcess::retire() noexcept {
  // Exchanged: a lost service stays lost.
  State running = State::running;
  state_.compare_exchange_strong(running, State::retired);
}

void ServiceProcess::lose() noexcept {
  state_ = State::lost;
}

// The zygote ends when its channel does, and its workers with it; the launcher is last. If the
// launcher were killed at once, these would be left to the application where that is what collects
// orphans: as pid 1 of a container.
bool ServiceProcess::end(const Patience& patience) noexcept {
  // Those who have released workers are done with it by then.
  const std::lock_guard lock(mutex_);
  if (endStep_ == EndStep::none) {
    lose();
    if (handles_.control) shutdown(handles_.control.get(), SHUT_RDWR);
    handles_.control.close();
    endStep_ = EndStep::closed;
    nextStepAt_ = Clock::now() + patience.closed;
  }
  if (!handles_.launcher) return true;
  const bool over = Clock::now() >= nextStepAt_;
  if (waitFor({.descriptor = handles_.launcher.get(), .events = POLLIN, .until = {}}) != 0 ||
      (over && endStep_ == EndStep::killed)) {
    reapLauncher(handles_.launcher);
    handles_.launcher.close();
    return true;
  }
  if (!over) return false;
  if (endStep_ == EndStep::closed) {
    // It kills its zygote, waits for all that this leaves, and ends.
    signalLauncher(handles_.launcher, SIGTERM);
    // One that somebody stopped would not listen.
    signalLauncher(handles_.launcher, SIGCONT);
    endStep_ = EndStep::asked;
    nextStepAt_ = Clock::now() + patience.asked;
  } else {
    signalLauncher(handles_.launcher, SIGKILL);
    endStep_ = EndStep::killed;
    nextStepAt_ = Clock::now() + patience.killed;
  }
  return false;
}

Wait ServiceProcess::nextStep() const noexcept {
  return {.descriptor = handles_.launcher.get(), .events = POLLIN, .until = nextStepAt_};
}

}  // namespace Keelgate
