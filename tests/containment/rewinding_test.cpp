// SPDX-License-Identifier: Apache-2.0
/// Whether rewinding a worker is exact: one that was taken over leaves a mark, is rewound, and
/// is compared with what it was, byte for byte. This process is its zygote.
#include "framework/contracts/memory_budget.h"
#include "framework/contracts/process.h"
#include "framework/protocol/data_frames.h"
#include "framework/sandbox/filter.h"
#include "framework/sandbox/processes.h"
#include "framework/sandbox/steps.h"
#include "framework/server/rewindable_worker.h"
#include "framework/server/worker.h"
#include "tests/containment/marks.h"
#include "tests/processes.h"
#include "tests/reply_frame.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/ptrace.h>
#include <sys/reg.h>
#include <sys/rseq.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <map>
#include <regex>

namespace Keelgate::Test {
namespace {

struct MarkingUnpacker {
  using SchemaType = VespCommandResponse;
  // NOLINTNEXTLINE(readability-convert-member-functions-to-static)
  [[nodiscard]] VespCommandResponse unpack(Bytes from) const {
    const std::string_view name(reinterpret_cast<const char*>(from.data()), from.size());
    for (const Mark& mark : marks) {
      if (mark.name == name) mark.leave();
    }
    return {};
  }
};

/// All that can be seen of a stopped worker from outside.
struct State {
  explicit State(pid_t process);

  Registers registers;
  /// What is there of its writable memory; the rest reads as zeros.
  std::map<std::uint64_t, std::string> pages;
  /// Lines of its figures, without those that count and that it cannot read itself.
  std::string figures;
};

State::State(pid_t process) {
  const std::string folder = "/proc/" + std::to_string(process) + '/';
  EXPECT_TRUE(readRegisters(process, registers));
  const File memory(open((folder + "mem").c_str(), O_RDONLY));
  const File table(open((folder + "pagemap").c_str(), O_RDONLY));
  std::ifstream maps(folder + "maps");
  for (std::string line; std::getline(maps, line); figures += line) {
    unsigned long begin = 0;
    unsigned long end = 0;
    char rights[5] = "";
    std::sscanf(line.c_str(), "%lx-%lx %4s", &begin, &end, rights);
    for (; rights[1] == 'w' && begin < end; begin += page) {
      std::uint64_t entry = 0;
      const auto place = static_cast<off_t>(begin / page * sizeof entry);
      EXPECT_EQ(pread(table.get(), &entry, sizeof entry, place), sizeof entry);
      // There, or swapped out.
      if (entry >> 62 == 0) continue;
      pages[begin].resize(page);
      EXPECT_GT(pread(memory.get(), pages[begin].data(), page, static_cast<off_t>(begin)), 0);
    }
  }
  const std::regex counting("^(Vm|Rss|State|SigQ|vol|nonvol)");
  for (const char* name : {"limits", "status"}) {
    std::ifstream file(folder + name);
    for (std::string line; std::getline(file, line);) {
      if (!std::regex_search(line, counting)) figures += line;
    }
  }
}

/// What is different, in words.
std::string compare(State before, State after) {
  // The kernel writes the number of the processor for each thread, in two places.
  const std::uint64_t sequences =
      before.registers.general[FS_BASE] + static_cast<std::uint64_t>(__rseq_offset);
  for (const std::size_t at : {0U, 4U, 20U, 24U}) {
    const std::uint64_t address = sequences + at;
    for (auto* pages : {&before.pages, &after.pages}) {
      std::string& bytes = (*pages)[address / page * page];
      bytes.resize(page);
      bytes.replace(address % page, 4, 4, '\0');
    }
  }
  for (const auto& [address, bytes] : before.pages) after.pages[address].resize(page);
  std::string different;
  for (const auto& [address, bytes] : after.pages) {
    before.pages[address].resize(page);
    if (before.pages[address] != bytes) different += "page " + std::to_string(address) + ' ';
  }
  if (!std::ranges::equal(before.registers.general, after.registers.general) ||
      before.registers.extended != after.registers.extended) {
    different += "registers ";
  }
  return before.figures == after.figures ? different : different + "figures";
}

/// A worker, and the zygote's and the client's parts.
class Laboratory {
 public:
  Laboratory() {
    alarm(60);
    server_.registerUnpacker<VespCommandResponse>(MarkingUnpacker());
    Sandbox::renounceNewPrivileges();
    Sandbox::prepareHeap();
    Sandbox::reserveHeap(heapFor(shortMessage));
    Sandbox::becomeUndumpable();
    const std::vector<sock_filter> filter = Sandbox::compile(Sandbox::workerRules);
    const pid_t zygote = getpid();
    const pid_t process = Sandbox::forkSelf(0);
    if (process == 0) {
      work(server_, 1,
           {.parent = zygote,
            .cpuSeconds = 100,
            .longestMessage = shortMessage,
            .rewindable = true,
            .filter = filter});
    }
    worker_.emplace(process);
    for (int step = 0; step < 2; ++step) {
      pollfd waiting{.fd = worker_->startStep(), .events = POLLIN, .revents = 0};
      if (poll(&waiting, 1, 5000) != 1 || !worker_->takeStep()) return;
    }
    if (stop() && worker_->keep()) fresh_.emplace(process);
  }

  [[nodiscard]] bool isReady() const { return worker_->isReady(); }
  bool goOn() { return worker_->goOn(); }
  bool rewind() {
    worker_->hangUp();
    return worker_->rewind();
  }
  [[nodiscard]] std::string difference() const {
    return compare(*fresh_, State(worker_->process()));
  }

  /// Whether it comes to an end that it can be rewound from. What nobody reads lies behind it, and
  /// is more than an honest worker takes at once.
  bool send(std::string_view text) {
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends) != 0) return false;
    channel_ = File(ends[0]);
    if (!Testing::comesTrue([&] { return worker_->give(ends[1]); })) return false;
    const auto header =
        Protocol::makeRequestHeader(recordNumber<VespCommandResponse>, 0, 0, text.size(), 0);
    Protocol::writeAll(channel_.get(), std::as_bytes(std::span(&header, 1)));
    Protocol::writeAll(channel_.get(), Testing::bytesOf(text));
    Protocol::writeAll(channel_.get(), std::vector<std::byte>(80'000, std::byte{0x77}));
    return stop() && stopped_ >> 8 == (SIGTRAP | PTRACE_EVENT_SECCOMP << 8);
  }
  [[nodiscard]] std::string received() const {
    std::array<char, 8192> bytes{};
    const ssize_t size = recv(channel_.get(), bytes.data(), bytes.size(), MSG_DONTWAIT);
    return {bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(size, 0))};
  }

 private:
  bool stop() {
    return waitpid(worker_->process(), &stopped_, __WALL) == worker_->process() &&
           WIFSTOPPED(stopped_);
  }

  KeelgateServer server_;
  Optional<RewindableWorker> worker_;
  Optional<State> fresh_;
  File channel_;
  int stopped_ = 0;
};

void tryMark(const Mark& mark) {
  Laboratory worker;
  ASSERT_TRUE(worker.isReady() && worker.goOn());
  if (!worker.send(mark.name)) {
    EXPECT_TRUE(mark.ends) << "ended";
    return;
  }
  EXPECT_NE(worker.difference(), "");
  ASSERT_EQ(worker.rewind(), !mark.ends);
  if (mark.ends) return;
  EXPECT_EQ(worker.difference(), "");
  ASSERT_TRUE(worker.goOn() && worker.send("nothing"));
  // What an honest worker answers to a message that is nothing.
  Data frame;
  Testing::appendReplyFrame(frame, 0, Protocol::ReplyKind::record,
                            Transport::lendRecord(VespCommandResponse{}).joined());
  EXPECT_EQ(worker.received(), std::string(reinterpret_cast<char*>(frame.data()), frame.size()));
}

class Rewinding : public testing::TestWithParam<Mark> {
 protected:
  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "only root may look into an undumpable process";
    static const bool possible =
        Sandbox::prepareRewinding() && Testing::inFork([] { return Laboratory().isReady(); }) == 1;
    if (!possible) GTEST_SKIP() << "this machine does not give what it takes";
  }
};

TEST_P(Rewinding, LeavesNoMark) {
  // In a process of its own, as its zygote.
  const auto trial = [] {
    tryMark(GetParam());
    return HasFailure() ? 1 : 0;
  };
  EXPECT_EQ(Testing::inFork(trial), 0);
}

INSTANTIATE_TEST_SUITE_P(C6, Rewinding, testing::ValuesIn(marks),
                         [](const auto& row) { return std::string(row.param.name); });

}  // namespace
}  // namespace Keelgate::Test
