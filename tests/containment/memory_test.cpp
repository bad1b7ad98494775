// SPDX-License-Identifier: Apache-2.0
/// How much memory a message gets, and where it lies.
#include "tests/containment/raw_client.h"

#include <sys/resource.h>

#include <bit>
#include <fstream>

namespace Keelgate::Test {
namespace {

/// An order to take so much memory, in a message of so many bytes.
std::string toEat(std::size_t bytes, std::size_t piece, std::size_t length) {
  std::string order = "eat " + std::to_string(bytes) + ' ' + std::to_string(piece);
  order.resize(std::max(order.size(), length), ' ');
  return order;
}

constexpr std::size_t piece = 65536;

/// One worker after the other that may have many messages.
class Reused : public Worker {
 protected:
  RawReply obeyNext(std::string_view order) {
    if (channel_ < 0) channel_ = reusing_.fork(9, 64 << 20);
    sendMessage(channel_, order, sequence_);
    return receiveReply(channel_, sequence_++);
  }
  WorkerEnd leave() {
    close(std::exchange(channel_, -1));
    sequence_ = 0;
    return reusing_.end(9);
  }

 private:
  RawClient reusing_{OBEDIENT_SERVICE, {.messages = 1000}};
  int channel_ = -1;
  std::uint32_t sequence_ = 0;
};

/// The budget is the message's and not the worker's.
TEST_F(Reused, C4AMessageHasTheSameMemoryInEveryWorker) {
  // By size of the pieces: of large ones as many as the limit says, of small ones fewer.
  for (const auto& [size, length] : {std::pair(piece, std::size_t{30}),
                                     {piece, std::size_t{1} << 20},
                                     {std::size_t{3000}, std::size_t{30}}}) {
    const std::size_t most = allocationLimit(length);
    for (const std::size_t part : {90U, 98U, 102U}) {
      const std::string order = toEat(most / 100 * part, size, length);
      const bool alone = service_.obey(order).first.result() == 0;
      EXPECT_EQ(alone, part < 100) << part << ' ' << size;
      // After others, of which one has left its memory full of small holes.
      EXPECT_EQ(obeyNext(toEat(4 << 20, 40, 0)).result(), 0);
      EXPECT_EQ(obeyNext(order).kind.has_value(), alone) << part << ' ' << size;
      const WorkerEnd end = leave();
      EXPECT_EQ(end.exitStatus(), alone ? 0 : Protocol::resourceExitStatus);
      EXPECT_LT(end.peakBytes, memoryBudget(length));
    }
  }
}

/// From start to start: of a few dozen addresses every bit that is random has both values.
TEST_F(Worker, C13AddressesAreRandom) {
  int bits = 0;
  if (std::ifstream("/proc/sys/vm/mmap_rnd_bits") >> bits && bits < 28) {
    GTEST_SKIP() << "this kernel is set to give " << bits << " bits (vm.mmap_rnd_bits)";
  }
  std::map<long, std::uint64_t> differences;
  std::map<long, std::uint64_t> first;
  for (int i = 0; i < 40; ++i) {
    RawClient service(OBEDIENT_SERVICE);
    for (const long what : {0L, 1L, 2L, 3L}) {
      const auto result = service.obey("address " + std::to_string(what)).first.result();
      const auto address = static_cast<std::uint64_t>(result.value());
      differences[what] |= first.try_emplace(what, address).first->second ^ address;
    }
  }
  // Some kernels place programs of 2 MiB and more, as this one is, on bounds of 2 MiB instead of
  // pages. What is shipped is smaller, which the test of the packages sees to.
  const int ofProgram = std::filesystem::file_size(OBEDIENT_SERVICE) < (2U << 20) ? 28 : 19;
  // The kernel's own constant, whatever it is set to: 18 bits of a stack's pages, 8 in its page.
#if defined __aarch64__
  constexpr int ofStack = 26;
#else
  constexpr int ofStack = 28;
#endif
  for (const auto& [what, seen] : differences) {
    EXPECT_GE(std::popcount(seen), what == 0 ? ofProgram : what == 1 ? ofStack : 28) << what;
  }
}

TEST_F(Worker, C4AMachineThatHasLessStillAnswers) {
  // Of address space, in MiB; the least is hardly more than what the zygote needs.
  for (const rlim_t space : {160U, 200U, 300U, 512U}) {
    RawOptions options;
    options.before = [space] {
      const rlimit little{.rlim_cur = space << 20, .rlim_max = space << 20};
      setrlimit(RLIMIT_AS, &little);
    };
    RawClient service(OBEDIENT_SERVICE, options);
    for (const std::size_t length : {6U, 1U << 18, 1U << 20, 3U << 20, 8U << 20}) {
      std::string order = "answer";
      order.resize(length, ' ');
      EXPECT_EQ(service.obey(order).first.result(), 0) << space << " for " << length;
    }
  }
}

}  // namespace
}  // namespace Keelgate::Test
