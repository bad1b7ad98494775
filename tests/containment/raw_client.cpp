// SPDX-License-Identifier: Apache-2.0
#include "tests/containment/raw_client.h"

#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/control_frames.h"
#include "framework/protocol/data_frames.h"
#include "framework/transport/record_coding.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>
#include <array>
#include <filesystem>
#include <stdexcept>
#include <utility>

namespace Keelgate::Test {

using namespace Protocol;
using namespace Transport;

namespace {

std::array<int, 2> makePair(int type) {
  std::array<int, 2> ends{};
  if (socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, ends.data()) != 0) {
    throw std::runtime_error("socketpair");
  }
  return ends;
}

}  // namespace

int WorkerEnd::signal() const {
  return WIFSIGNALED(status) ? WTERMSIG(status) : 0;
}
int WorkerEnd::exitStatus() const {
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

RawClient::RawClient(const std::string& path, const RawOptions& options) {
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
  sendFrame(ControlKind::hello, 0, {options.messages, options.cpuSeconds});
  first_ = receiveFrame();
}

RawClient::~RawClient() {
  if (launcher_ > 0) stop();
}

int RawClient::stop() {
  close(control_);
  int status = 0;
  waitpid(std::exchange(launcher_, -1), &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

std::string RawClient::refusal() const {
  if (first_.kind != ControlKind::refused) return "";
  return startFailureSentence(static_cast<StartStep>(first_.numbers[0]),
                              static_cast<int>(first_.numbers[1]));
}

std::vector<pid_t> RawClient::workers(std::size_t count) const {
  std::set<pid_t> all;
  Testing::comesTrue([&] { return (all = Testing::children(zygote())).size() >= count; });
  return {all.begin(), all.end()};
}

void RawClient::sendFrame(ControlKind kind, std::uint32_t slot, std::vector<std::uint64_t> numbers,
                          int descriptor, std::uint32_t magic) {
  ControlFrame frame = makeControlFrame(kind, slot);
  frame.magic = magic;
  std::copy(numbers.begin(), numbers.end(), frame.numbers.begin());
  static_cast<void>(sendControl(control_, frame, descriptor, Waiting::yes));
}

ControlFrame RawClient::receiveFrame() {
  ControlFrame frame{};
  static_cast<void>(receiveControl(control_, frame, Waiting::yes));
  return frame;
}

int RawClient::fork(std::uint32_t slot, std::uint64_t longestMessage) {
  const auto ends = makePair(SOCK_STREAM);
  sendFrame(ControlKind::fork, slot, {longestMessage}, ends[1]);
  close(ends[1]);
  return ends[0];
}

void RawClient::kill(std::uint32_t slot) {
  sendFrame(ControlKind::kill, slot, {});
}

WorkerEnd RawClient::end(std::uint32_t slot) {
  while (!ended_.contains(slot)) {
    const ControlFrame frame = receiveFrame();
    if (frame.kind != ControlKind::exit) throw std::runtime_error("the service has gone");
    ended_[frame.slot] = {.status = static_cast<int>(frame.numbers[0]),
                          .peakBytes = frame.numbers[1]};
  }
  return ended_.extract(slot).mapped();
}

std::pair<RawReply, WorkerEnd> RawClient::obey(std::string_view order) {
  const int channel = fork(0, order.size());
  sendMessage(channel, order);
  RawReply reply = receiveReply(channel);
  close(channel);
  return {std::move(reply), end(0)};
}

std::set<std::string> descriptorsOf(pid_t process) {
  std::set<std::string> names;
  const auto list = "/proc/" + std::to_string(process) + "/fd";
  for (const auto& entry : std::filesystem::directory_iterator(list)) {
    names.insert(entry.path().filename());
  }
  return names;
}

void sendMessage(int channel, std::string_view message, std::uint32_t sequence,
                 std::size_t record) {
  const RequestHeader header =
      makeRequestHeader(static_cast<std::uint16_t>(record), 0, 0, message.size(), sequence);
  send(channel, &header, sizeof header, MSG_NOSIGNAL);
  send(channel, message.data(), message.size(), MSG_NOSIGNAL);
}

RawReply receiveReply(int channel, std::uint32_t sequence) {
  ReplyParser parser(sequence, ~std::uint64_t{0});
  Data received;
  for (std::size_t filled = 0; parser.parse(received) == ReplyParser::State::incomplete;) {
    received.resize(parser.needed());
    if (!readAll(channel, std::span(received).subspan(filled)))
      return {parser.log(), {}, {}, false};
    filled = received.size();
  }
  const Bytes body = parser.body(received);
  return {parser.log(), parser.kind(), Data(body.begin(), body.end()), parser.isLast()};
}

Optional<Int64> resultOf(const RawReply& reply) {
  if (reply.kind != ReplyKind::record) return std::nullopt;
  return decodeRecord<VespCommandResponse>(reply.body).messageId;
}

}  // namespace Keelgate::Test
