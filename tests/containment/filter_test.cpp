// SPDX-License-Identifier: Apache-2.0
/// C1 and C2 from the outside: what a taken-over worker can ask of the kernel.
#include "tests/containment/raw_client.h"

#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <cerrno>
#include <csignal>
#include <map>
#include <string>

namespace Keelgate::Test {
namespace {

/// Sends orders to a window of workers at once and calls `check(order, reply, end)` for each.
template <class Check>
void obeyAll(const std::vector<std::string>& orders, Check&& check) {
  RawClient service(OBEDIENT_SERVICE);
  ASSERT_TRUE(service.ready()) << service.refusal();
  constexpr std::size_t window = 32;
  std::map<std::size_t, int> channels;
  for (std::size_t next = 0, done = 0; done < orders.size();) {
    for (; next < orders.size() && next < done + window; ++next) {
      channels[next] = service.fork(static_cast<std::uint32_t>(next));
      sendOrder(channels[next], orders[next]);
    }
    const RawReply reply = receiveReply(channels[done]);
    close(channels[done]);
    check(orders[done], reply, service.end(static_cast<std::uint32_t>(done)));
    ++done;
  }
}

/// How a worker fared: what its call gave back, or what ended it.
std::string outcome(const RawReply& reply, const WorkerEnd& end) {
  if (end.signal() != 0) return "signal " + std::to_string(end.signal());
  const Optional<Int64> result = resultOf(reply);
  return result ? "result " + std::to_string(*result) : "exit " + std::to_string(end.exitStatus());
}

/// With descriptor 0 every read is none on the channel.
const std::map<std::string, std::string> survivedOrders{
    {"call 0 3 0 0", "result 0"},
    {"call 1 3 0 0", "result 0"},
    {"call 231 0 0 0", "exit 0"},
    {"call 231 3 0 0", "exit 3"},
    // Refused, and not made.
    {"call 12 0 0 0", "result 0"},
    {"call 12 3 0 0", "result 0"},
    {"call 9 0 0 0", "result " + std::to_string(-ENOMEM)},
    {"call 9 3 0 0", "result " + std::to_string(-ENOMEM)},
    // uretprobe and uprobe never reach any filter: the kernel answers them before, and gives what
    // it gives to anybody who is not at a probe.
    {"call 335 0 0 0", "signal " + std::to_string(SIGILL)},
    {"call 335 3 0 0", "signal " + std::to_string(SIGILL)},
    {"call 336 0 0 0", "result " + std::to_string(-ENXIO)},
    {"call 336 3 0 0", "result " + std::to_string(-ENXIO)},
};

TEST(C2, EveryCallButThreeKillsTheWorker) {
#ifdef KEELGATE_UNSEALED
  // Nor may it run: the calls would be made.
  GTEST_SKIP() << "this build has no seal";
#endif
  std::vector<std::string> orders;
  for (long call = 0; call <= 600; ++call) {
    orders.push_back("call " + std::to_string(call) + " 0 0 0");
    orders.push_back("call " + std::to_string(call) + " 3 0 0");
    for (const char* argument : {" 0", " 3"}) {
      orders.push_back("call " + std::to_string(call + 0x4000'0000) + argument + " 0 0");
      orders.push_back("int80 " + std::to_string(call) + argument);
    }
  }
  for (const char* call : {"-1", "2147483648", "4294967295"}) {
    orders.push_back("call " + std::string(call) + " 3 0 0");
  }
  for (int slot = 0; slot < 3; ++slot) orders.push_back("vsyscall " + std::to_string(slot));
  std::size_t survivors = 0;
  obeyAll(orders, [&](const std::string& order, const RawReply& reply, const WorkerEnd& end) {
    const auto survived = survivedOrders.find(order);
    if (survived == survivedOrders.end()) {
      // A kernel may have no vsyscall page at all.
      if (order.starts_with("vsyscall") && end.signal() == SIGSEGV) return;
      EXPECT_EQ(outcome(reply, end), "signal " + std::to_string(SIGSYS)) << order;
      return;
    }
    ++survivors;
    // Older kernels lack these two, so that the filter sees them.
    const bool probe = order.starts_with("call 335") || order.starts_with("call 336");
    if (probe && end.signal() == SIGSYS) return;
    EXPECT_EQ(outcome(reply, end), survived->second) << order;
  });
  EXPECT_EQ(survivors, survivedOrders.size());
}

}  // namespace
}  // namespace Keelgate::Test
