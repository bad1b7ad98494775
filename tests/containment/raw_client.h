// SPDX-License-Identifier: Apache-2.0
/// Drives a service by hand, frame by frame, so that tests see what a client would hide.
///
/// For one thread.
#pragma once

#include "framework/contracts/memory_budget.h"
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/control_frames.h"
#include "framework/protocol/data_frames.h"
#include "framework/transport/record_coding.h"
#include "tests/processes.h"

#include <keelgate/records.h>

#include <gtest/gtest.h>

#include <fcntl.h>
#include <sys/socket.h>

#include <functional>
#include <map>
#include <stdexcept>
#include <vector>

namespace Keelgate::Test {

/// The end of a worker, as its exit frame has it.
struct WorkerEnd {
  int status;
  std::uint64_t peakBytes;

  [[nodiscard]] int signal() const { return WIFSIGNALED(status) ? WTERMSIG(status) : 0; }
  /// -1 when a signal ended it.
  [[nodiscard]] int exitStatus() const { return WIFEXITED(status) ? WEXITSTATUS(status) : -1; }
};

/// The frames of a reply, up to the end of the channel.
struct RawReply {
  std::vector<std::string> log;
  Optional<Protocol::ReplyKind> kind = {};
  Data body = {};
  bool last = false;

  /// The messageId of the answer, which is what a call gave back.
  [[nodiscard]] Optional<Int64> result() const {
    if (kind != Protocol::ReplyKind::record) return std::nullopt;
    return Transport::decodeRecord<VespCommandResponse>(body).messageId;
  }
};

/// Sends a message as a request for a record; by default, an order for the obedient service.
inline void sendMessage(int channel, std::string_view message, std::uint32_t sequence = 0,
                        std::size_t record = recordNumber<VespCommandResponse>) {
  const auto header = Protocol::makeRequestHeader(static_cast<std::uint16_t>(record), 0, 0,
                                                  message.size(), sequence);
  send(channel, &header, sizeof header, MSG_NOSIGNAL);
  send(channel, message.data(), message.size(), MSG_NOSIGNAL);
}

/// Reads frames until an answer or the end of the channel; of a malformed reply nothing is left.
inline RawReply receiveReply(int channel, std::uint32_t sequence = 0) {
  using Protocol::ReplyParser;
  ReplyParser parser(sequence, ~std::uint64_t{0});
  Data received;
  for (std::size_t filled = 0; parser.parse(received) == ReplyParser::State::incomplete;) {
    received.resize(parser.needed());
    if (!Protocol::readAll(channel, std::span(received).subspan(filled))) return {parser.log()};
    filled = received.size();
  }
  const Bytes body = parser.body(received);
  return {parser.log(), parser.kind(), Data(body.begin(), body.end()), parser.isLast()};
}

struct RawOptions {
  std::uint64_t messages = 1;
  /// Enough for a machine that is emulated.
  std::uint64_t cpuSeconds = 100;
  /// Runs in the service's process before it is executed, to take something from it.
  std::function<void()> before = {};
};

class RawClient {
 public:
  using ControlFrame = Protocol::ControlFrame;
  using ControlKind = Protocol::ControlKind;

  /// Starts the service and greets it; ready() or refusal() tells the outcome.
  explicit RawClient(const std::string& path, const RawOptions& options = {}) {
    const auto ends = makePair(SOCK_SEQPACKET);
    // Opened first: what is taken away may be the right or the way to open it.
    const int program = open(path.c_str(), O_PATH | O_CLOEXEC);
    launcher_ = ::fork();
    if (launcher_ == 0) {
      if (options.before) options.before();
      dup2(ends[1], serviceDescriptor);
      const char* const arguments[] = {path.c_str(), nullptr};
      const char* const environment[] = {nullptr};
      execveat(program, "", const_cast<char**>(arguments), const_cast<char**>(environment),
               AT_EMPTY_PATH);
      _exit(127);
    }
    close(program);
    close(ends[1]);
    control_ = ends[0];
    sendFrame(ControlKind::hello, 0,
              {options.messages, options.cpuSeconds, Testing::forksAlone() ? 1U : 0U});
    first_ = receiveFrame();
  }
  ~RawClient() {
    if (launcher_ > 0) stop();
  }
  RawClient(const RawClient&) = delete;
  RawClient& operator=(const RawClient&) = delete;

  [[nodiscard]] bool ready() const { return first_.kind == ControlKind::ready; }
  [[nodiscard]] std::uint64_t layers() const { return first_.numbers[0]; }
  [[nodiscard]] std::string refusal() const {
    return startFailureSentence(static_cast<StartStep>(first_.numbers[0]),
                                static_cast<int>(first_.numbers[1]));
  }
  [[nodiscard]] pid_t launcher() const { return launcher_; }
  [[nodiscard]] pid_t zygote() const { return *Testing::children(launcher_).begin(); }
  /// The living workers, as this process sees them, once there are so many.
  [[nodiscard]] std::vector<pid_t> workers(std::size_t count) const {
    std::set<pid_t> all;
    Testing::comesTrue([&] { return (all = Testing::children(zygote())).size() >= count; });
    return {all.begin(), all.end()};
  }

  /// Hangs up, or has been hung up on, and waits for the end of the service: the launcher's exit
  /// status as a shell has it.
  int stop() {
    close(control_);
    int status = 0;
    waitpid(std::exchange(launcher_, -1), &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  }

  /// Sends any control frame, with or without a descriptor, which stays the caller's.
  void sendFrame(ControlKind kind, std::uint32_t slot, std::vector<std::uint64_t> numbers,
                 int descriptor = -1) {
    ControlFrame frame = Protocol::makeControlFrame(kind, slot);
    std::copy(numbers.begin(), numbers.end(), frame.numbers.begin());
    static_cast<void>(sendControl(control_, frame, descriptor, Protocol::Waiting::yes));
  }
  /// The next control frame; a frame of zeros when the service has gone.
  ControlFrame receiveFrame() {
    ControlFrame frame{};
    static_cast<void>(receiveControl(control_, frame, Protocol::Waiting::yes));
    return frame;
  }

  /// Asks for a worker for messages of so many bytes; returns the channel to it, which is the
  /// caller's to close.
  int fork(std::uint32_t slot, std::uint64_t longestMessage = shortMessage) {
    const auto ends = makePair(SOCK_STREAM);
    sendFrame(ControlKind::fork, slot, {longestMessage}, ends[1]);
    close(ends[1]);
    return ends[0];
  }
  void kill(std::uint32_t slot) { sendFrame(ControlKind::kill, slot, {}); }
  /// Waits for the end of a slot's worker.
  WorkerEnd end(std::uint32_t slot) {
    while (!ended_.contains(slot)) {
      const ControlFrame frame = receiveFrame();
      if (frame.kind != ControlKind::exit) throw std::runtime_error("the service has gone");
      ended_[frame.slot] = {static_cast<int>(frame.numbers[0]), frame.numbers[1]};
    }
    return ended_.extract(slot).mapped();
  }
  /// One order for a fresh worker: the reply, and how the worker ended.
  std::pair<RawReply, WorkerEnd> obey(std::string_view order) {
    const int channel = fork(0, order.size());
    sendMessage(channel, order);
    RawReply reply = receiveReply(channel);
    close(channel);
    return {std::move(reply), end(0)};
  }

 private:
  static std::array<int, 2> makePair(int type) {
    std::array<int, 2> ends{};
    if (socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, ends.data()) != 0) {
      throw std::runtime_error("socketpair");
    }
    return ends;
  }

  pid_t launcher_ = -1;
  int control_ = -1;
  ControlFrame first_{};
  std::map<std::uint32_t, WorkerEnd> ended_;
};

/// The open descriptors of a process. Throws std::filesystem::filesystem_error.
inline std::set<std::string> descriptorsOf(pid_t process) {
  std::set<std::string> names;
  const auto list = "/proc/" + std::to_string(process) + "/fd";
  for (const auto& entry : std::filesystem::directory_iterator(list)) {
    names.insert(entry.path().filename());
  }
  return names;
}

/// A service that is ready; workers that must go on answering afterwards.
class Worker : public testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(service_.ready()) << service_.refusal(); }
  void TearDown() override {
    if (HasFatalFailure() || IsSkipped()) return;
    EXPECT_EQ(service_.obey("answer").first.result(), 0);
  }

  RawClient service_{OBEDIENT_SERVICE};
};

}  // namespace Keelgate::Test
