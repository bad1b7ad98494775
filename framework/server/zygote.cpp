// SPDX-License-Identifier: Apache-2.0
/// One loop over four descriptors: the client's frames, the launcher's death, the workers' ends,
/// and the next step of a worker that is being made ready to be rewound.
#include "framework/server/zygote.h"

#include "framework/contracts/memory_budget.h"
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/control_frames.h"
#include "framework/sandbox/limits.h"
#include "framework/sandbox/processes.h"
#include "framework/sandbox/rewinding.h"
#include "framework/server/worker.h"

#include <poll.h>
#include <sys/resource.h>
#include <sys/signalfd.h>
#include <sys/wait.h>
#include <unistd.h>
#include <csignal>
#include <ctime>

namespace Keelgate {

using Protocol::ControlFrame;
using Protocol::ControlKind;

namespace {

ControlFrame exitFrame(std::uint32_t slot, int status, const rusage& used) {
  const auto microseconds = [](const timeval& time) {
    return static_cast<std::uint64_t>(time.tv_sec) * 1'000'000 +
           static_cast<std::uint64_t>(time.tv_usec);
  };
  // The kernel counts in KiB.
  const auto peakBytes = static_cast<std::uint64_t>(used.ru_maxrss) * 1024;
  return Protocol::makeControlFrame(ControlKind::exit, slot,
                                    {static_cast<std::uint64_t>(status), peakBytes,
                                     microseconds(used.ru_utime) + microseconds(used.ru_stime), 0});
}

/// While there is something to do, deaths are not waited for: what has died is looked for with each
/// frame, or after this time, and the process is not woken for each of them.
constexpr timespec togetherWithin{.tv_sec = 0, .tv_nsec = 500'000};

/// A client that has gone is not an error here: the next receive tells.
void send(const ControlFrame& frame) {
  static_cast<void>(Protocol::sendControl(serviceDescriptor, frame, Protocol::noDescriptor,
                                          Protocol::Waiting::yes));
}

}  // namespace

void Zygote::serve() {
  greet();
  pollfd channels[]{{.fd = serviceDescriptor, .events = POLLIN, .revents = 0},
                    {.fd = seal_.launcher, .events = 0, .revents = 0},
                    {.fd = -1, .events = POLLIN, .revents = 0},
                    {.fd = -1, .events = POLLIN, .revents = 0}};
  for (;;) {
    pollfd& deaths = channels[2];
    channels[3].fd = workers_.startStep();
    const bool isBusy = deaths.fd < 0;
    // ppoll and not poll: the kernel takes it up again after a stop without a call of its own.
    const int ready =
        ppoll(channels, std::size(channels), isBusy ? &togetherWithin : nullptr, nullptr);
    if (ready < 0) continue;
    if (channels[1].revents != 0) return;
    // First what a request waits for.
    if (channels[0].revents != 0 && !takeFrame()) return;
    if (deaths.revents != 0) {
      signalfd_siginfo death;
      static_cast<void>(!read(deaths.fd, &death, sizeof death));
    }
    if (channels[3].revents != 0) workers_.takeStep();
    reap();
    deaths.fd = ready == 0 ? seal_.childDeaths : -1;
  }
}

void Zygote::greet() {
  const Optional<Received> hello = receive();
  if (!hello) _exit(0);
  if (hello->frame.kind != ControlKind::hello) throw StartError(StartStep::readFrame, 0);
  messages_ = hello->frame.numbers[0];
  workerSeal_.cpuSeconds = hello->frame.numbers[1];
  workers_ = WorkerList(workerSeal_.cpuSeconds);
  const bool rewinds = hello->frame.numbers[2] == 0 && messages_ == 1 &&
                       Sandbox::mayHaveProcessorTime(workers_.cpuLimit());
  if (seal_.canRewind && !rewinds) renounceRewinding();
  send(Protocol::makeControlFrame(ControlKind::ready, 0, {seal_.layers, Protocol::ownVersion()}));
}

Optional<Zygote::Received> Zygote::receive() {
  Received received{};
  switch (Protocol::receiveControl(serviceDescriptor, received.frame, received.descriptor,
                                   Protocol::Waiting::yes)) {
    case Protocol::Transfer::complete:
      return received;
    case Protocol::Transfer::malformed:
      // The client is trusted, and still fatal: every worker inherits the state of this process.
      throw StartError(StartStep::readFrame, 0);
    case Protocol::Transfer::wouldBlock:
    case Protocol::Transfer::ended:
      break;
  }
  return std::nullopt;
}

bool Zygote::takeFrame() {
  const Optional<Received> received = receive();
  if (!received) return false;
  switch (received->frame.kind) {
    case ControlKind::fork:
      workerSeal_.longestMessage = received->frame.numbers[0];
      fork(received->frame.slot, received->descriptor);
      return true;
    case ControlKind::kill:
      kill(received->frame.slot);
      return true;
    default:
      throw StartError(StartStep::readFrame, 0);
  }
}

void Zygote::fork(std::uint32_t slot, int channel) {
  // Two workers on one slot: an exit could be told of the wrong one.
  if (workers_.processOf(slot) != 0) throw StartError(StartStep::readFrame, 0);
  // Workers for long messages write to more memory than it pays to restore.
  if (!seal_.canRewind || workerSeal_.longestMessage > shortMessage) {
    forkOnce(slot, channel);
    return;
  }
  if (workers_.give(slot, channel)) return;
  // One may have ended just now.
  reap();
  if (workers_.give(slot, channel)) return;
  forkOnce(slot, channel);
  if (workers_.isRewindingHopeless()) {
    renounceRewinding();
  } else if (workers_.isAnotherWorthIt()) {
    forkToRewind();
  }
}

void Zygote::forkToRewind() {
  Sandbox::WorkerSeal seal = workerSeal_;
  seal.rewindable = true;
  seal.channel = -1;
  // One for all short messages.
  seal.longestMessage = shortMessage;
  seal.cpuSeconds = workers_.cpuLimit();
  const pid_t process = Sandbox::forkSelf(0);
  if (process == 0) work(server_, messages_, seal);
  workers_.addRewindable(process);
}

void Zygote::renounceRewinding() {
  seal_.canRewind = false;
  Sandbox::renounceRewinding();
}

void Zygote::forkOnce(std::uint32_t slot, int channel) {
  workerSeal_.channel = channel;
  const pid_t process = Sandbox::forkSelf(0);
  // What was forked never comes back here.
  if (process == 0) work(server_, messages_, workerSeal_);
  close(channel);
  if (process > 0) {
    workers_.add(slot, process);
  } else {
    // Every fork gets its exit, also one that came to nothing: nobody waits for a worker in vain.
    ControlFrame none = exitFrame(slot, 0, rusage{});
    none.numbers[3] = 1;
    send(none);
  }
}

void Zygote::kill(std::uint32_t slot) {
  // One that has just answered may be rewound yet.
  reap();
  // Not reaped yet, so the number is still this worker's.
  if (const pid_t process = workers_.processOf(slot); process != 0) ::kill(process, SIGKILL);
}

void Zygote::reap() {
  int status = 0;
  rusage used{};
  for (;;) {
    const pid_t process = wait4(-1, &status, WNOHANG, &used);
    if (process <= 0) return;
    if (const auto end = workers_.note(process, status, used)) {
      send(exitFrame(end->slot, end->status, end->used));
    }
  }
}

}  // namespace Keelgate
