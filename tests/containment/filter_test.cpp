// SPDX-License-Identifier: Apache-2.0
/// C1 and C2 from the outside: what a taken-over worker can ask of the kernel.
#include "tests/containment/machine.h"
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
      sendMessage(channels[next], orders[next]);
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

std::string order(long call, const std::string& first) {
  return "call " + std::to_string(call) + ' ' + first + " 0 0";
}

/// With descriptor 0 every read is none on the channel.
const std::map<std::string, std::string> survivedOrders{
    {order(SYS_read, "3"), "result 0"},
    {order(SYS_write, "3"), "result 0"},
    {order(SYS_exit_group, "0"), "exit 0"},
    {order(SYS_exit_group, "3"), "exit 3"},
    // Refused, and not made.
    {order(SYS_brk, "0"), "result 0"},
    {order(SYS_brk, "3"), "result 0"},
    {order(SYS_mmap, "0"), "result " + std::to_string(-ENOMEM)},
    {order(SYS_mmap, "3"), "result " + std::to_string(-ENOMEM)},
    // uretprobe and uprobe of x86-64 never reach any filter: the kernel answers them before, and
    // gives what it gives to anybody who is not at a probe.
    {order(335, "0"), "signal " + std::to_string(SIGILL)},
    {order(335, "3"), "signal " + std::to_string(SIGILL)},
    {order(336, "0"), "result " + std::to_string(-ENXIO)},
    {order(336, "3"), "result " + std::to_string(-ENXIO)},
};

TEST(C2, EveryCallButThreeKillsTheWorker) {
  std::vector<std::string> orders;
  for (long call = 0; call <= 600; ++call) {
    for (const char* first : {"0", "3"}) {
      orders.push_back(order(call, first));
      orders.push_back(order(call + 0x4000'0000, first));
      if (hasOtherGates) orders.push_back("int80 " + std::to_string(call) + ' ' + first);
    }
  }
  for (const long call : {-1L, 2147483648, 4294967295}) orders.push_back(order(call, "3"));
  for (int slot = 0; hasOtherGates && slot < 3; ++slot) {
    orders.push_back("vsyscall " + std::to_string(slot));
  }
  std::size_t survivors = 0;
  obeyAll(orders, [&](const std::string& given, const RawReply& reply, const WorkerEnd& end) {
    const auto survived = survivedOrders.find(given);
    if (survived == survivedOrders.end()) {
      // A kernel may have no vsyscall page at all.
      if (given.starts_with("vsyscall") && end.signal() == SIGSEGV) return;
      EXPECT_EQ(outcome(reply, end), "signal " + std::to_string(SIGSYS)) << given;
      return;
    }
    ++survivors;
    // Elsewhere the filter sees them.
    const bool probe = given.starts_with("call 335") || given.starts_with("call 336");
    if (probe && end.signal() == SIGSYS) return;
    EXPECT_EQ(outcome(reply, end), survived->second) << given;
  });
  EXPECT_EQ(survivors, survivedOrders.size());
}

}  // namespace
}  // namespace Keelgate::Test
