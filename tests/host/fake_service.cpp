// SPDX-License-Identifier: Apache-2.0
// A service without seal and without manners. Its workers do what the message says, step by step;
// how it starts follows from the name that it was started under (fake_service.mute and so on).
#include "framework/client/control_frames.h"
#include "framework/transport/layers.h"
#include "tests/host/script.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <map>
#include <string_view>

using namespace Keelgate;
using namespace Keelgate::Host;
using namespace Keelgate::Transport;

namespace {

constexpr int channel = serviceDescriptor;

void readAll(void* to, std::size_t size) {
  for (auto* at = static_cast<char*>(to); size > 0;) {
    const ssize_t n = read(channel, at, size);
    if (n <= 0) _exit(0);
    at += n;
    size -= static_cast<std::size_t>(n);
  }
}

void writeAll(Bytes bytes) {
  while (!bytes.empty()) {
    const ssize_t n = send(channel, bytes.data(), bytes.size(), 0);
    if (n <= 0) _exit(0);
    bytes = bytes.subspan(static_cast<std::size_t>(n));
  }
}

void writeFrame(std::uint32_t sequence, Bytes body, ReplyKind kind = ReplyKind::record) {
  const ReplyHeader header{magic, protocolVersion, kind, sequence, 0, body.size()};
  writeAll(std::as_bytes(std::span(&header, 1)));
  writeAll(body);
}

/// A sanitizer's runtime would make an ordinary exit of it.
void die(int signal) {
  ::signal(signal, SIG_DFL);
  raise(signal);
}

void obey(Bytes script, std::uint32_t sequence) {
  while (script.size() >= sizeof(Step)) {
    Step step;
    std::memcpy(&step, script.data(), sizeof step);
    script = script.subspan(sizeof step);
    const bool hasBytes = step.op <= Op::log;
    const Bytes bytes = script.first(hasBytes ? step.amount : 0);
    script = script.subspan(bytes.size());
    if (step.op == Op::write) writeAll(bytes);
    if (step.op == Op::answer) writeFrame(sequence, bytes);
    if (step.op == Op::log) writeFrame(sequence, bytes, ReplyKind::log);
    if (step.op == Op::pause) usleep(step.amount * 1000);
    if (step.op == Op::raise) die(static_cast<int>(step.amount));
    if (step.op == Op::raiseIfUsed && sequence > 0) die(static_cast<int>(step.amount));
    if (step.op == Op::hitZygote) kill(getppid(), static_cast<int>(step.amount));
    if (step.op == Op::exit) _exit(static_cast<int>(step.amount));
    while (step.op == Op::endless) writeAll(std::array<std::byte, 4096>());
  }
}

[[noreturn]] void work(std::uint64_t messages, bool early) {
  if (early) writeFrame(0, {});
  for (std::uint64_t i = 0; i < messages; ++i) {
    RequestHeader header;
    readAll(&header, sizeof header);
    const std::uint64_t signal = header.command - raiseAfterHeader;
    if (signal > 0 && signal < NSIG) die(static_cast<int>(signal));
    if (header.command == answerBeforeBody) writeFrame(header.sequence, {});
    while (header.command == ignoreBody || header.command == answerBeforeBody) pause();
    String service(header.serviceLength, ' ');
    readAll(service.data(), service.size());
    Data script(header.bodyLength);
    readAll(script.data(), script.size());
    obey(script, header.sequence);
  }
  _exit(0);
}

/// The next control frame, with the descriptor that came along or -1.
bool receive(ControlFrame& frame, int& descriptor) {
  iovec piece{&frame, sizeof frame};
  alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof descriptor)> extra{};
  msghdr packet{};
  packet.msg_iov = &piece;
  packet.msg_iovlen = 1;
  packet.msg_control = extra.data();
  packet.msg_controllen = extra.size();
  if (recvmsg(channel, &packet, 0) != sizeof frame) return false;
  descriptor = -1;
  if (const cmsghdr* header = CMSG_FIRSTHDR(&packet)) {
    std::memcpy(&descriptor, CMSG_DATA(header), sizeof descriptor);
  }
  return true;
}

class Zygote {
 public:
  Zygote(std::uint64_t messages, std::string_view manner)
      : messages_(messages),
        early_(manner == "early"),
        barren_(manner == "barren"),
        slow_(manner == "slow") {}

  void serve() {
    sigset_t child;
    sigemptyset(&child);
    sigaddset(&child, SIGCHLD);
    sigaddset(&child, SIGTERM);
    sigprocmask(SIG_BLOCK, &child, nullptr);
    pollfd entries[] = {{channel, POLLIN, 0}, {signalfd(-1, &child, SFD_NONBLOCK), POLLIN, 0}};
    for (;;) {
      poll(entries, 2, -1);
      signalfd_siginfo signal;
      if (read(entries[1].fd, &signal, sizeof signal) > 0) {
        if (signal.ssi_signo == SIGTERM) end();
        reportExits();
      }
      if (entries[0].revents == 0) continue;
      ControlFrame frame;
      int descriptor;
      if (!receive(frame, descriptor)) end();
      if (frame.kind == ControlKind::fork) fork(frame.slot, descriptor);
      if (frame.kind == ControlKind::kill) kill(frame.slot);
    }
  }

 private:
  /// Leaves nobody behind, as a launcher does.
  [[noreturn]] void end() {
    for (const auto& [pid, slot] : slots_) ::kill(pid, SIGKILL);
    while (wait(nullptr) > 0) continue;
    _exit(0);
  }
  void fork(std::uint32_t slot, int descriptor) {
    if (barren_) {
      close(descriptor);
      ControlFrame frame = makeFrame(ControlKind::exit, slot);
      frame.numbers[3] = 1;
      send(channel, &frame, sizeof frame, MSG_NOSIGNAL);
      return;
    }
    const pid_t pid = ::fork();
    if (pid == 0) {
      prctl(PR_SET_PDEATHSIG, SIGKILL);
      dup2(descriptor, channel);
      for (int other = channel + 1; other < 64; ++other) close(other);
      work(messages_, early_);
    }
    close(descriptor);
    slots_[pid] = slot;
  }
  void kill(std::uint32_t slot) {
    for (const auto& [pid, its] : slots_) {
      if (its != slot) continue;
      if (!slow_) ::kill(pid, SIGKILL);
      const ControlFrame frame = makeFrame(ControlKind::killed, slot);
      send(channel, &frame, sizeof frame, MSG_NOSIGNAL);
    }
  }
  void reportExits() {
    int status;
    for (pid_t pid; (pid = waitpid(-1, &status, WNOHANG)) > 0;) {
      ControlFrame frame = makeFrame(ControlKind::exit, slots_[pid]);
      frame.numbers[0] = static_cast<std::uint64_t>(status);
      slots_.erase(pid);
      send(channel, &frame, sizeof frame, MSG_NOSIGNAL);
    }
  }

  std::uint64_t messages_;
  bool early_;
  bool barren_;
  /// As if the kernel took its time to end whom it killed.
  bool slow_;
  std::map<pid_t, std::uint32_t> slots_;
};

}  // namespace

int main(int, char** arguments) {
  const std::string_view name(arguments[0]);
  const std::string_view manner = name.substr(name.rfind('.') + 1);
  ControlFrame hello;
  int none;
  if (!receive(hello, none) || manner == "dies") return 0;
  ControlFrame ready = makeFrame(ControlKind::ready, 0);
  ready.numbers[0] = manner == "bare" ? 0x3f : ~std::uint64_t{0};
  ready.numbers[1] = ownVersion() + (manner == "newer" ? 1 : 0);
  if (manner == "refuses") {
    ready.kind = ControlKind::refused;
    ready.numbers[0] = static_cast<std::uint64_t>(Obstacle::filter);
  }
  if (manner == "babbles") ready.magic = 0;
  if (manner != "mute") send(channel, &ready, sizeof ready, MSG_NOSIGNAL);
  while (manner == "mute" || manner == "stuck") pause();
  Zygote(hello.numbers[0], manner).serve();
}
