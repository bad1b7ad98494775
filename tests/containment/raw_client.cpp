// SPDX-License-Identifier: Apache-2.0
#include "tests/containment/raw_client.h"

#include "framework/client/control_frames.h"
#include "framework/transport/layers.h"
#include "framework/transport/record_coding.h"

#include <fcntl.h>
#include <keelgate/records.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>
#include <array>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <stdexcept>

namespace Keelgate::Test {

using namespace Transport;

namespace {

std::vector<pid_t> childrenOf(pid_t process) {
  const std::string text = std::to_string(process);
  std::ifstream list("/proc/" + text + "/task/" + text + "/children");
  std::vector<pid_t> children;
  for (pid_t child; list >> child;) children.push_back(child);
  return children;
}

std::array<int, 2> makePair(int type) {
  std::array<int, 2> ends{};
  if (socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, ends.data()) != 0) {
    throw std::runtime_error("socketpair");
  }
  return ends;
}

bool receiveAll(int channel, void* to, std::size_t size) {
  return size == 0 || recv(channel, to, size, MSG_WAITALL) == static_cast<ssize_t>(size);
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
  return waitForLauncher();
}

int RawClient::waitForLauncher() {
  int status = 0;
  waitpid(launcher_, &status, 0);
  launcher_ = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

std::string RawClient::refusal() const {
  if (first_.kind != ControlKind::refused) return "";
  return sentence(static_cast<Obstacle>(first_.numbers[0]), static_cast<int>(first_.numbers[1]));
}

pid_t RawClient::zygote() const {
  return childrenOf(launcher_).at(0);
}
std::vector<pid_t> RawClient::workers() const {
  return childrenOf(zygote());
}

void RawClient::sendFrame(ControlKind kind, std::uint32_t slot, std::vector<std::uint64_t> numbers,
                          int descriptor, std::uint32_t magic) {
  ControlFrame frame = makeFrame(kind, slot);
  frame.magic = magic;
  std::copy(numbers.begin(), numbers.end(), std::begin(frame.numbers));
  Keelgate::sendFrame(control_, frame, descriptor, deadlineAfter(std::chrono::seconds(1)));
}

ControlFrame RawClient::receiveFrame() {
  ControlFrame frame{};
  if (recv(control_, &frame, sizeof frame, 0) != sizeof frame) return {};
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
    if (frame.kind == ControlKind::killed && killed_.insert(frame.slot).second) continue;
    if (frame.kind != ControlKind::exit) throw std::runtime_error("the service has gone");
    ended_[frame.slot] = {.killed = killed_.erase(frame.slot) != 0,
                          .status = static_cast<int>(frame.numbers[0]),
                          .peakBytes = frame.numbers[1],
                          .cpuMicroseconds = frame.numbers[2]};
  }
  return ended_.extract(slot).mapped();
}

std::pair<RawReply, WorkerEnd> RawClient::obey(std::string_view order) {
  const int channel = fork(0, order.size());
  sendOrder(channel, order);
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

void sendOrder(int channel, std::string_view order, std::uint32_t sequence) {
  sendMessage(channel, recordNumber<VespCommandResponse>, order, sequence);
}

void sendMessage(int channel, std::size_t record, std::string_view message,
                 std::uint32_t sequence) {
  const RequestHeader header{.magic = magic,
                             .version = protocolVersion,
                             .record = static_cast<std::uint16_t>(record),
                             .sequence = sequence,
                             .serviceLength = 0,
                             .bodyLength = message.size(),
                             .command = 0};
  send(channel, &header, sizeof header, MSG_NOSIGNAL);
  send(channel, message.data(), message.size(), MSG_NOSIGNAL);
}

RawReply receiveReply(int channel) {
  RawReply reply{};
  ReplyHeader header{};
  while (!reply.kind && receiveAll(channel, &header, sizeof header)) {
    Data body(header.bodyLength);
    if (!receiveAll(channel, body.data(), body.size())) break;
    if (header.kind == ReplyKind::log) {
      reply.log.emplace_back(reinterpret_cast<const char*>(body.data()), body.size());
    } else {
      reply.kind = header.kind;
      reply.body = std::move(body);
    }
  }
  return reply;
}

Optional<Int64> resultOf(const RawReply& reply) {
  if (reply.kind != ReplyKind::record) return std::nullopt;
  return decodeRecord<VespCommandResponse>(reply.body).messageId;
}

}  // namespace Keelgate::Test
