// SPDX-License-Identifier: Apache-2.0
// A service without seal and without manners. Its workers do what the message says, step by step;
// how it starts follows from the name that it was started under (fake_service.mute and so on).
#include "framework/contracts/layers.h"
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/control_frames.h"
#include "framework/protocol/data_frames.h"
#include "tests/host/script.h"
#include "tests/reply_frame.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <map>
#include <string_view>

using namespace Keelgate;
using namespace Keelgate::Host;
using namespace Keelgate::Protocol;

namespace {

constexpr int channel = serviceDescriptor;

void write(Bytes bytes) {
  if (!writeAll(channel, bytes)) _exit(0);
}

void writeFrame(std::uint32_t sequence, Bytes body, ReplyKind kind = ReplyKind::record) {
  Data frame;
  Testing::appendReplyFrame(frame, sequence, kind, body);
  write(frame);
}

/// A sanitizer's runtime would make an ordinary exit of it.
void die(int signal) {
  ::signal(signal, SIG_DFL);
  raise(signal);
}

/// A service is given its channel and nothing else, nor signals that its starter ignores.
bool hasOnlyChannel() {
  if (signal(SIGCHLD, SIG_DFL) != SIG_DFL) return false;
  for (int other = 0; other < 64; ++other) {
    if (other != channel && fcntl(other, F_GETFD) >= 0) return false;
  }
  return environ == nullptr || *environ == nullptr;
}

void obey(Bytes script, std::uint32_t sequence) {
  while (script.size() >= sizeof(Step)) {
    Step step;
    std::memcpy(&step, script.data(), sizeof step);
    script = script.subspan(sizeof step);
    const Bytes bytes = script.first(step.op <= Op::log ? step.amount : 0);
    script = script.subspan(bytes.size());
    if (step.op == Op::write) write(bytes);
    if (step.op == Op::answer) writeFrame(sequence, bytes);
    if (step.op == Op::log) writeFrame(sequence, bytes, ReplyKind::log);
    if (step.op == Op::pause) usleep(step.amount * 1000);
    if (step.op == Op::raise) die(static_cast<int>(step.amount));
    if (step.op == Op::raiseIfUsed && sequence > 0) die(static_cast<int>(step.amount));
    if (step.op == Op::hitZygote) kill(getppid(), static_cast<int>(step.amount));
    if (step.op == Op::answerZygote) writeFrame(sequence, recordNumbered(getppid()));
    for (; step.op == Op::trickle; usleep(100)) write(std::array<std::byte, 1>());
    if (step.op == Op::exit) _exit(static_cast<int>(step.amount));
    while (step.op == Op::endless) write(std::array<std::byte, 4096>());
  }
}

[[noreturn]] void work(std::uint64_t messages) {
  for (std::uint64_t i = 0; i < messages; ++i) {
    RequestHeader header;
    if (!readAll(channel, std::as_writable_bytes(std::span(&header, 1)))) break;
    const std::uint64_t signal = header.command - raiseAfterHeader;
    if (signal > 0 && signal < NSIG) die(static_cast<int>(signal));
    if (header.command == answerBeforeBody) writeFrame(header.sequence, {});
    while (header.command == ignoreBody || header.command == answerBeforeBody) pause();
    Data script(header.serviceLength + header.bodyLength);
    if (!readAll(channel, script)) break;
    obey(Bytes(script).subspan(header.serviceLength), header.sequence);
  }
  _exit(0);
}

bool receive(ControlFrame& frame, int& descriptor) {
  return receiveControl(channel, frame, descriptor, Waiting::yes) == Transfer::complete;
}

void send(const ControlFrame& frame) {
  static_cast<void>(sendControl(channel, frame, noDescriptor, Waiting::yes));
}

struct Zygote {
  const std::uint64_t messages;
  const std::string_view manner;
  std::map<pid_t, std::uint32_t> slots{};

  void serve() {
    pollfd entry{.fd = channel, .events = POLLIN, .revents = 0};
    for (;; reportExits()) {
      if (poll(&entry, 1, 2) == 0) continue;
      ControlFrame frame;
      int descriptor;
      // Its workers follow it.
      if (!receive(frame, descriptor)) _exit(0);
      if (frame.kind == ControlKind::fork) fork(frame.slot, descriptor);
      if (frame.kind == ControlKind::kill) kill(frame.slot);
    }
  }

  void fork(std::uint32_t slot, int descriptor) {
    if (manner == "barren") {
      close(descriptor);
      send(makeControlFrame(ControlKind::exit, slot, {0, 0, 0, 1}));
      return;
    }
    const pid_t pid = ::fork();
    if (pid == 0) {
      prctl(PR_SET_PDEATHSIG, SIGKILL);
      dup2(descriptor, channel);
      for (int other = channel + 1; other < 64; ++other) close(other);
      work(messages);
    }
    close(descriptor);
    slots[pid] = slot;
  }
  void kill(std::uint32_t slot) {
    for (const auto& [pid, its] : slots) {
      if (its == slot) ::kill(pid, SIGKILL);
    }
  }
  void reportExits() {
    int status;
    for (pid_t pid; (pid = waitpid(-1, &status, WNOHANG)) > 0;) {
      send(makeControlFrame(ControlKind::exit, slots[pid], {static_cast<std::uint64_t>(status)}));
      slots.erase(pid);
    }
  }
};

}  // namespace

int main(int, char** arguments) {
  const std::string_view name(arguments[0]);
  const std::string_view manner = name.substr(name.rfind('.') + 1);
  ControlFrame hello;
  int none;
  if (!hasOnlyChannel()) return 1;
  if (!receive(hello, none) || manner == "dies") return 0;
  ControlFrame ready = makeControlFrame(ControlKind::ready);
  ready.numbers[0] = manner == "bare"       ? requiredLayers
                     : manner == "unsealed" ? requiredLayers & ~layerStrictFilter
                                            : ~std::uint64_t{0};
  ready.numbers[1] = ownVersion() + (manner == "newer" ? 1 : 0);
  if (manner == "refuses") {
    ready.kind = ControlKind::refused;
    ready.numbers = {static_cast<std::uint64_t>(StartStep::loadFilter), EPERM, 0, 0};
  }
  if (manner == "babbles") ready.magic = 0;
  send(ready);
  while (manner == "stuck") pause();
  Zygote{hello.numbers[0], manner}.serve();
}
