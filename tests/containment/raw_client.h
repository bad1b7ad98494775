// SPDX-License-Identifier: Apache-2.0
/// Drives a service by hand, frame by frame, so that tests see what a client would hide.
///
/// For one thread.
#pragma once

#include "framework/contracts/memory_budget.h"
#include "framework/protocol/frames.h"
#include "tests/processes.h"

#include <gtest/gtest.h>
#include <keelgate/records.h>
#include <sys/types.h>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace Keelgate::Test {

/// The end of a worker, as its exit frame has it.
struct WorkerEnd {
  int status;
  std::uint64_t peakBytes;

  [[nodiscard]] int signal() const;
  /// -1 when a signal ended it.
  [[nodiscard]] int exitStatus() const;
};

/// The frames of a reply, up to the end of the channel.
struct RawReply {
  std::vector<std::string> log;
  Optional<Protocol::ReplyKind> kind;
  Data body;
  bool last = false;
};

struct RawOptions {
  std::uint64_t messages = 1;
  std::uint64_t cpuSeconds = 5;
  /// Runs in the service's process before it is executed, to take something from it.
  std::function<void()> before;
};

class RawClient {
 public:
  /// Starts the service and greets it; ready() or obstacle() tells the outcome.
  explicit RawClient(const std::string& path, const RawOptions& options = {});
  ~RawClient();
  RawClient(const RawClient&) = delete;
  RawClient& operator=(const RawClient&) = delete;

  [[nodiscard]] bool ready() const { return first_.kind == Protocol::ControlKind::ready; }
  [[nodiscard]] std::uint64_t layers() const { return first_.numbers[0]; }
  [[nodiscard]] std::string refusal() const;
  [[nodiscard]] pid_t launcher() const { return launcher_; }
  [[nodiscard]] pid_t zygote() const { return *Testing::children(launcher_).begin(); }
  /// The living workers, as this process sees them, once there are so many.
  [[nodiscard]] std::vector<pid_t> workers(std::size_t count) const;

  /// Hangs up, or has been hung up on, and waits for the end of the service: the launcher's exit
  /// status as a shell has it.
  int stop();

  /// Sends any control frame, with or without a descriptor, which stays the caller's.
  void sendFrame(Protocol::ControlKind kind, std::uint32_t slot, std::vector<std::uint64_t> numbers,
                 int descriptor = -1, std::uint32_t magic = Protocol::magic);
  /// The next control frame; a frame of zeros when the service has gone.
  Protocol::ControlFrame receiveFrame();

  /// Asks for a worker for messages of so many bytes; returns the channel to it, which is the
  /// caller's to close.
  int fork(std::uint32_t slot, std::uint64_t longestMessage = shortMessage);
  void kill(std::uint32_t slot);
  /// Waits for the end of a slot's worker.
  WorkerEnd end(std::uint32_t slot);
  /// One order for a fresh worker: the reply, and how the worker ended.
  std::pair<RawReply, WorkerEnd> obey(std::string_view order);

 private:
  pid_t launcher_ = -1;
  int control_ = -1;
  Protocol::ControlFrame first_{};
  std::map<std::uint32_t, WorkerEnd> ended_;
};

/// The open descriptors of a process. Throws std::filesystem::filesystem_error.
std::set<std::string> descriptorsOf(pid_t process);

/// Sends a message as a request for a record; by default, an order for the obedient service.
void sendMessage(int channel, std::string_view message, std::uint32_t sequence = 0,
                 std::size_t record = recordNumber<VespCommandResponse>);
/// Reads frames until an answer or the end of the channel; of a malformed reply nothing is left.
RawReply receiveReply(int channel, std::uint32_t sequence = 0);
/// The messageId of the answer, which is what a call gave back.
Optional<Int64> resultOf(const RawReply& reply);

/// A service that is ready; workers that must go on answering afterwards.
class Worker : public testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(service_.ready()) << service_.refusal(); }
  void TearDown() override {
    if (HasFatalFailure() || IsSkipped()) return;
    EXPECT_EQ(resultOf(service_.obey("answer").first), 0);
  }

  RawClient service_{OBEDIENT_SERVICE};
};

}  // namespace Keelgate::Test
