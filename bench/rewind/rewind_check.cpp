// SPDX-License-Identifier: Apache-2.0
/// Whether it is exact: a sealed worker that was taken over leaves a mark, is set back, and is
/// compared with what it was. To be run as root; prints a table, and fails where a row is not as it
/// should be.
#include "bench/rewind/marks.h"
#include "bench/rewind/rewindable_worker.h"
#include "bench/rewind/worker_state.h"
#include "framework/contracts/memory_budget.h"
#include "framework/contracts/process.h"
#include "framework/protocol/data_frames.h"
#include "framework/sandbox/credentials.h"
#include "framework/sandbox/filter.h"
#include "framework/sandbox/heap.h"
#include "framework/server/worker.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include <algorithm>
#include <cstdio>
#include <cstring>

namespace Keelgate::Rewind {
namespace {

struct MarkingUnpacker {
  using SchemaType = VespCommandResponse;
  // NOLINTNEXTLINE(readability-convert-member-functions-to-static)
  [[nodiscard]] VespCommandResponse unpack(Bytes from) const {
    const std::string_view name(reinterpret_cast<const char*>(from.data()), from.size());
    for (const Mark& mark : marks()) {
      if (mark.name == name) mark.leave();
    }
    return {};
  }
};

struct Channel {
  File ours;
  File theirs;
};

Channel makeChannel() {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) std::abort();
  return {.ours = File(ends[0]), .theirs = File(ends[1])};
}

/// How a worker came out of a message.
struct Outcome {
  bool noticed = false;
  Difference left;
  bool setBack = false;
  Difference rest;
  std::size_t pages = 0;
  std::string reply;
};

class Laboratory {
 public:
  Laboratory() {
    server_.registerUnpacker<VespCommandResponse>(MarkingUnpacker());
    Sandbox::renounceNewPrivileges();
    Sandbox::prepareHeap();
    filter_ = Sandbox::compile(Sandbox::workerRules());
    nowhere_ = std::move(makeChannel().theirs);
    notices_ = noticeEnds();
  }

  /// What two forks that have done nothing have for a difference.
  Difference betweenForks();
  /// `undo`: whether the worker is set back, or only started again where it was, for comparison.
  Outcome tryMark(std::string_view name, bool undo = true);

 private:
  pid_t forkFor(const Channel& channel);
  static void send(const Channel& channel, std::string_view text);
  bool waitForEnd(const RewindableWorker& worker, End& end) const;
  void secondMessage(RewindableWorker& worker, const Channel& channel, Outcome& outcome) const;

  KeelgateServer server_;
  std::vector<sock_filter> filter_;
  File proc_{open("/proc", O_RDONLY | O_DIRECTORY | O_CLOEXEC)};
  File nowhere_;
  int notices_ = -1;
};

pid_t Laboratory::forkFor(const Channel& channel) {
  const Sandbox::WorkerSeal seal{.channel = channel.theirs.get(),
                                 .parent = getpid(),
                                 .cpuSeconds = 100,
                                 .longestMessage = shortMessage,
                                 .filter = filter_};
  return RewindableWorker::fork([&] { work(server_, 1, seal); });
}

Difference Laboratory::betweenForks() {
  const Channel channel = makeChannel();
  const pid_t processes[]{forkFor(channel), forkFor(channel)};
  const auto one = RewindableWorker::take(proc_.get(), processes[0]);
  const auto other = RewindableWorker::take(proc_.get(), processes[1]);
  return compare(lookAt(one->process()), lookAt(other->process()));
}

void Laboratory::send(const Channel& channel, std::string_view text) {
  const auto header =
      Protocol::makeRequestHeader(recordNumber<VespCommandResponse>, 0, 0, text.size(), 0);
  Protocol::writeAll(channel.ours.get(), std::as_bytes(std::span(&header, 1)));
  Protocol::writeAll(channel.ours.get(), std::as_bytes(std::span(text)));
}

/// False when it has stopped or ended otherwise.
bool Laboratory::waitForEnd(const RewindableWorker& worker, End& end) const {
  for (int i = 0; i < 2000; ++i) {
    pollfd notices{.fd = notices_, .events = POLLIN, .revents = 0};
    if (poll(&notices, 1, 1) == 1) {
      const Optional<End> received = receiveEnd(notices_);
      if (received) end = *received;
      return received.has_value();
    }
    siginfo_t about{};
    waitid(P_PID, static_cast<id_t>(worker.process()), &about,
           WEXITED | WSTOPPED | WNOHANG | WNOWAIT);
    if (about.si_pid != 0) return false;
  }
  return false;
}

Outcome Laboratory::tryMark(std::string_view name, bool undo) {
  Outcome outcome;
  const Channel first = makeChannel();
  const auto worker = RewindableWorker::take(proc_.get(), forkFor(first));
  const WorkerState fresh = lookAt(worker->process());
  if (!worker->go()) std::abort();
  send(first, name);
  // What nobody reads, but who reads it against the rules.
  Protocol::writeAll(first.ours.get(), std::vector<std::byte>(8192, std::byte{0x77}));
  End end{};
  outcome.noticed = waitForEnd(*worker, end);
  const Channel second = makeChannel();
  if (!outcome.noticed || !worker->park(notices_, end, nowhere_.get()) ||
      !worker->stop(notices_, second.theirs.get())) {
    return outcome;
  }
  outcome.left = compare(fresh, lookAt(worker->process()));
  outcome.setBack = !undo || worker->setBack();
  outcome.pages = worker->memory().restored();
  if (!outcome.setBack) return outcome;
  if (undo && !runToCall(worker->process())) std::abort();
  outcome.rest = compare(fresh, lookAt(worker->process()));
  if (undo) secondMessage(*worker, second, outcome);
  return outcome;
}

void Laboratory::secondMessage(RewindableWorker& worker, const Channel& channel,
                               Outcome& outcome) const {
  if (!worker.go()) return;
  send(channel, "nothing");
  End end{};
  if (!waitForEnd(worker, end) || !worker.park(notices_, end, nowhere_.get())) return;
  char reply[4096];
  const ssize_t size = recv(channel.ours.get(), reply, sizeof reply, MSG_DONTWAIT);
  if (size > 0) outcome.reply.assign(reply, static_cast<std::size_t>(size));
  int unread = 0;
  if (ioctl(channel.ours.get(), FIONREAD, &unread) != 0 || unread != 0) outcome.reply.clear();
}

void print(std::string_view name, const Difference& left, const char* verdict,
           const Difference& rest, std::size_t pages) {
  std::printf("%-24.*s %8zu %6zu %6zu %4zu   %6zu   %-9s %6zu %4zu %4zu %4zu\n",
              static_cast<int>(name.size()), name.data(), left.memory, left.general, left.extended,
              left.figures.size(), pages, verdict, rest.memory, rest.general, rest.extended,
              rest.figures.size());
  for (const std::string& line : rest.figures) std::printf("    %s\n", line.c_str());
}

/// What an honest worker answers to a message that is nothing.
std::string expectedReply() {
  Data frame;
  Protocol::appendReplyFrame(frame, 0, Protocol::ReplyKind::record,
                             Transport::encodeRecord(VespCommandResponse{}));
  return {reinterpret_cast<const char*>(frame.data()), frame.size()};
}

bool tryTwoForks() {
  print("two forks", Laboratory().betweenForks(), "-", {}, 0);
  return true;
}

/// That the comparison sees what it is to see.
bool tryWithout() {
  const Outcome outcome = Laboratory().tryMark("heap", false);
  const bool seen = outcome.rest.memory > 0 && outcome.rest.general > 0;
  print("heap, not set back", outcome.left, seen ? "seen" : "NOT SEEN", outcome.rest, 0);
  return seen;
}

bool tryMark(const Mark& mark) {
  const Outcome outcome = Laboratory().tryMark(mark.name);
  const bool exact = outcome.setBack && outcome.rest.isNone() && outcome.reply == expectedReply();
  const bool asItShould = mark.ends ? !outcome.setBack : exact;
  const char* const verdict = outcome.setBack ? "set back" : "thrown";
  print(mark.name, outcome.left, asItShould ? verdict : "WRONG", outcome.rest, outcome.pages);
  return asItShould;
}

/// In a process of its own: what was kept of one worker would be part of the next one's memory.
bool inOwnProcess(const std::function<bool()>& trial) {
  std::fflush(stdout);
  const pid_t process = ::fork();
  if (process == 0) {
    const bool good = trial();
    std::fflush(stdout);
    // Another 0 would be a notice to itself.
    _exit(good ? ownEnd : 1);
  }
  int status = 0;
  return waitpid(process, &status, 0) == process && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

bool tryAll() {
  std::puts(
      "                           left behind: bytes in         pages   and then    the rest\n"
      "mark                       memory general vector /proc   written");
  bool good = inOwnProcess(tryTwoForks);
  good = inOwnProcess(tryWithout) && good;
  for (const Mark& mark : marks()) {
    good = inOwnProcess([&] { return tryMark(mark); }) && good;
  }
  return good;
}

}  // namespace
}  // namespace Keelgate::Rewind

int main() {
  return Keelgate::Rewind::tryAll() ? 0 : 1;
}
