// SPDX-License-Identifier: Apache-2.0
#include "bench/rewind/rewinding_zygote.h"

#include "bench/rewind/rewindable_worker.h"
#include "bench/rewind/rewinding_seal.h"
#include "framework/contracts/memory_budget.h"
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/control_frames.h"
#include "framework/sandbox/landlock.h"
#include "framework/sandbox/processes.h"
#include "framework/server/worker.h"

#include <poll.h>
#include <sys/ptrace.h>
#include <sys/signalfd.h>
#include <sys/wait.h>

#include <algorithm>
#include <csignal>
#include <system_error>

namespace Keelgate::Rewind {

namespace {

using Protocol::ControlFrame;
using Protocol::ControlKind;

class RewindingZygote {
 public:
  RewindingZygote(const KeelgateServer& server, RewindingSeal seal)
      : server_(server),
        seal_(std::move(seal)),
        workerSeal_{.parent = seal_.zygote.process, .filter = seal_.zygote.workerFilter} {}

  void serve();

 private:
  struct Child {
    Optional<std::uint32_t> slot;
    pid_t process;
    /// Nothing in one that was forked to end.
    std::unique_ptr<RewindableWorker> rewindable;
  };

  bool takeFrame();
  void fork(std::uint32_t slot, int channel);
  bool rewindOne(std::uint32_t slot, int channel);
  bool startOne(std::uint32_t slot, int channel);
  void forkOnce(std::uint32_t slot, int channel);
  void run() const;
  void takeEnd();
  void reap();
  static void tellExit(std::uint32_t slot, int status, bool neverStarted = false);
  void forget(std::vector<Child>::iterator child, int status);

  const KeelgateServer& server_;
  RewindingSeal seal_;
  std::uint64_t messages_ = 0;
  std::uint64_t cpuSeconds_ = 0;
  Sandbox::WorkerSeal workerSeal_;
  std::vector<Child> children_;
};

void RewindingZygote::serve() {
  const auto send = [](const ControlFrame& frame) {
    static_cast<void>(Protocol::sendControl(serviceDescriptor, frame, Protocol::noDescriptor,
                                            Protocol::Waiting::yes));
  };
  ControlFrame hello;
  int none = Protocol::noDescriptor;
  if (Protocol::receiveControl(serviceDescriptor, hello, none, Protocol::Waiting::yes) !=
          Protocol::Transfer::complete ||
      hello.kind != ControlKind::hello) {
    return;
  }
  messages_ = hello.numbers[0];
  cpuSeconds_ = hello.numbers[1];
  send(Protocol::makeControlFrame(ControlKind::ready, 0,
                                  {seal_.zygote.layers, Protocol::ownVersion()}));
  pollfd channels[]{{.fd = serviceDescriptor, .events = POLLIN, .revents = 0},
                    {.fd = seal_.notices, .events = POLLIN, .revents = 0},
                    {.fd = seal_.zygote.childDeaths, .events = POLLIN, .revents = 0},
                    {.fd = seal_.zygote.launcher, .events = 0, .revents = 0}};
  for (;;) {
    if (ppoll(channels, std::size(channels), nullptr, nullptr) < 0) continue;
    if (channels[3].revents != 0) return;
    if (channels[1].revents != 0) takeEnd();
    if (channels[0].revents != 0 && !takeFrame()) return;
    if (channels[2].revents == 0) continue;
    signalfd_siginfo death;
    if (read(seal_.zygote.childDeaths, &death, sizeof death) > 0) reap();
  }
}

bool RewindingZygote::takeFrame() {
  ControlFrame frame;
  int descriptor = Protocol::noDescriptor;
  if (Protocol::receiveControl(serviceDescriptor, frame, descriptor, Protocol::Waiting::yes) !=
      Protocol::Transfer::complete) {
    return false;
  }
  if (frame.kind == ControlKind::fork) {
    workerSeal_.longestMessage = frame.numbers[0];
    fork(frame.slot, descriptor);
    close(descriptor);
    return true;
  }
  for (const Child& child : children_) {
    if (frame.kind == ControlKind::kill && child.slot == frame.slot) {
      ::kill(child.process, SIGKILL);
    }
  }
  return true;
}

/// Workers for long messages are forked and end: they dirty more than it pays to put back.
void RewindingZygote::fork(std::uint32_t slot, int channel) {
  const bool rewinding = messages_ == 1 && workerSeal_.longestMessage <= shortMessage;
  // One worker serves all of these, so it is made for the longest.
  if (rewinding) workerSeal_.longestMessage = shortMessage;
  if (rewinding && (rewindOne(slot, channel) || startOne(slot, channel))) return;
  forkOnce(slot, channel);
}

bool RewindingZygote::rewindOne(std::uint32_t slot, int channel) {
  for (auto child = children_.begin(); child != children_.end();) {
    if (child->slot) {
      ++child;
      continue;
    }
    // Each message has at least the processor time that it would have in a fork.
    const bool tired = child->rewindable->processorTime() > cpuSeconds_ * 1'000'000'000;
    if (!tired && child->rewindable->rewind(seal_.notices, channel)) {
      child->slot = slot;
      return true;
    }
    child = children_.erase(child);
  }
  return false;
}

bool RewindingZygote::startOne(std::uint32_t slot, int channel) {
  workerSeal_.channel = channel;
  workerSeal_.cpuSeconds = 2 * cpuSeconds_ + 1;
  std::unique_ptr<RewindableWorker> worker;
  try {
    const pid_t process = RewindableWorker::fork([this] { run(); });
    if (process > 0) worker = RewindableWorker::take(seal_.proc, process);
  } catch (const std::system_error&) {
  }
  if (!worker || !worker->go()) return false;
  const pid_t process = worker->process();
  children_.push_back({.slot = slot, .process = process, .rewindable = std::move(worker)});
  return true;
}

void RewindingZygote::run() const {
  if (!Sandbox::renounceByLandlock()) return;
  work(server_, messages_, workerSeal_);
}

void RewindingZygote::forkOnce(std::uint32_t slot, int channel) {
  workerSeal_.channel = channel;
  workerSeal_.cpuSeconds = cpuSeconds_;
  const pid_t process = Sandbox::forkSelf(0);
  if (process == 0) run();
  if (process > 0) {
    children_.push_back({.slot = slot, .process = process, .rewindable = nullptr});
  } else {
    tellExit(slot, 0, true);
  }
}

void RewindingZygote::takeEnd() {
  const Optional<End> end = receiveEnd(seal_.notices);
  if (!end) return;
  const auto child = std::find_if(children_.begin(), children_.end(),
                                  [&](const Child& c) { return c.process == end->process; });
  if (child == children_.end() || !child->rewindable) {
    letEnd(seal_.notices, *end);
    return;
  }
  if (!child->rewindable->park(seal_.notices, *end, seal_.nowhere)) {
    ::kill(child->process, SIGKILL);
    return;
  }
  tellExit(*child->slot, 0);
  child->slot.reset();
}

/// What the client does with the figures of an end is nothing, so far: they are left out.
void RewindingZygote::tellExit(std::uint32_t slot, int status, bool neverStarted) {
  static_cast<void>(
      Protocol::sendControl(serviceDescriptor,
                            Protocol::makeControlFrame(
                                ControlKind::exit, slot,
                                {static_cast<std::uint64_t>(status), 0, 0, neverStarted ? 1U : 0U}),
                            Protocol::noDescriptor, Protocol::Waiting::yes));
}

void RewindingZygote::reap() {
  int status = 0;
  for (;;) {
    const pid_t process = wait4(-1, &status, WNOHANG, nullptr);
    if (process <= 0) return;
    const auto child = std::find_if(children_.begin(), children_.end(),
                                    [process](const Child& c) { return c.process == process; });
    if (child == children_.end()) continue;
    if (!WIFSTOPPED(status)) {
      forget(child, status);
    } else if (status >> 16 == PTRACE_EVENT_STOP) {
      ptrace(PTRACE_CONT, process, nullptr, nullptr);
    } else {
      // What would have come to it without a tracer comes to it.
      ptrace(PTRACE_CONT, process, nullptr,
             reinterpret_cast<void*>(static_cast<std::size_t>(WSTOPSIG(status))));
    }
  }
}

void RewindingZygote::forget(std::vector<Child>::iterator child, int status) {
  if (child->slot) tellExit(*child->slot, status);
  if (child->rewindable) child->rewindable->noteReaped();
  children_.erase(child);
}

}  // namespace

RewindingServer& RewindingServer::service() {
  static RewindingServer shared;
  return shared;
}

void RewindingServer::resume(Optional<SandboxID> sandboxID) try {
  if (!sandboxID) return;
  RewindingZygote(*this, sealRewindingZygote()).serve();
  _exit(ownEnd);
} catch (const StartError& why) {
  const auto last = Protocol::makeControlFrame(
      ControlKind::refused, 0,
      {static_cast<std::uint64_t>(why.step), static_cast<std::uint64_t>(why.error)});
  static_cast<void>(Protocol::sendControl(serviceDescriptor, last, Protocol::noDescriptor,
                                          Protocol::Waiting::yes));
  _exit(Protocol::refusedExitStatus);
}

}  // namespace Keelgate::Rewind
