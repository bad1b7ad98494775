// SPDX-License-Identifier: Apache-2.0
/// The compiled filters, run by an interpreter of our own over every number and the edges of the
/// argument, against what is said of them in words.
#include "framework/sandbox/filter.h"

#include "framework/sandbox/architecture.h"

#include <gtest/gtest.h>
#include <linux/seccomp.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <algorithm>
#include <csignal>
#include <cstring>

namespace Keelgate::Sandbox {
namespace {

/// Runs a program as the kernel does. A jump or load that the kernel would not accept ends in a
/// failure, and so does an end without an answer.
unsigned run(const std::vector<sock_filter>& program, const seccomp_data& data) {
  unsigned accumulator = 0;
  for (std::size_t at = 0; at < program.size(); ++at) {
    const sock_filter& step = program[at];
    switch (step.code) {
      case BPF_LD | BPF_W | BPF_ABS:
        if (step.k + sizeof accumulator > sizeof data || step.k % 4 != 0) break;
        std::memcpy(&accumulator, reinterpret_cast<const char*>(&data) + step.k,
                    sizeof accumulator);
        continue;
      case BPF_JMP | BPF_JEQ | BPF_K:
        at += accumulator == step.k ? step.jt : step.jf;
        continue;
      case BPF_RET | BPF_K:
        return step.k;
      default:
        break;
    }
    break;
  }
  ADD_FAILURE() << "the program runs off its end or does what no filter here should";
  return SECCOMP_RET_ALLOW;
}

constexpr std::uint64_t arguments[] = {
    0, 1, 2, 3, 4, 17, 0xffff'ffff, 0x1'0000'0003, 0x3'0000'0000, ~std::uint64_t{0}};

/// Every number that has ever been one, around every power of two, and the x32 convention's.
std::vector<int> numbers() {
  std::vector<int> all;
  for (int number = 0; number < 4096; ++number) {
    all.push_back(number);
    all.push_back(number | 0x4000'0000);
  }
  for (unsigned bit = 12; bit < 32; ++bit) {
    for (const unsigned near : {-1U, 0U, 1U}) {
      all.push_back(static_cast<int>((1U << bit) + near));
    }
  }
  return all;
}

constexpr unsigned architectures[] = {
    AUDIT_ARCH_X86_64, AUDIT_ARCH_I386, AUDIT_ARCH_AARCH64, AUDIT_ARCH_ARM, 0U, ~0U};

template <class Expected>
void expectEverywhere(std::span<const Rule> rules, Expected&& expected) {
  const std::vector<sock_filter> program = compile(rules);
  const std::vector<sock_filter> trial = compile(rules, SECCOMP_RET_TRAP);
  for (const unsigned arch : architectures) {
    for (const int number : numbers()) {
      for (const std::uint64_t argument : arguments) {
        const seccomp_data data{.nr = number,
                                .arch = arch,
                                .instruction_pointer = 0,
                                .args = {argument, ~argument, 3, 3, 3, 3}};
        const unsigned wanted = arch == nativeCalls
                                    ? expected(number, static_cast<unsigned>(argument))
                                    : SECCOMP_RET_KILL_PROCESS;
        ASSERT_EQ(run(program, data), wanted) << arch << ' ' << number << ' ' << argument;
        // The trial copy decides the same, and traps what the other kills for.
        const unsigned tried = wanted == SECCOMP_RET_KILL_PROCESS ? SECCOMP_RET_TRAP : wanted;
        ASSERT_EQ(run(trial, data), tried) << arch << ' ' << number << ' ' << argument;
      }
    }
  }
}

TEST(Filter, C1WorkerReadsWritesAndExits) {
  expectEverywhere(workerRules(), [](int number, unsigned first) -> unsigned {
    if ((number == SYS_read || number == SYS_write) && first == 3) return SECCOMP_RET_ALLOW;
    if (number == SYS_exit_group) return SECCOMP_RET_ALLOW;
    if (number == SYS_brk) return SECCOMP_RET_ERRNO;
    if (number == SYS_mmap) return SECCOMP_RET_ERRNO | 12;
    return SECCOMP_RET_KILL_PROCESS;
  });
}

TEST(Filter, ZygoteHasNoCallThatOpensOrExecutes) {
  const std::vector<int> free{SYS_ppoll,       SYS_wait4,   SYS_kill, SYS_dup3,  SYS_close,
                              SYS_close_range, SYS_getppid, SYS_read, SYS_write, SYS_exit_group};
  expectEverywhere(zygoteRules(), [&](int number, unsigned first) -> unsigned {
    const bool allowed =
        std::find(free.begin(), free.end(), number) != free.end() ||
        ((number == SYS_recvmsg || number == SYS_sendto || number == SYS_shutdown) && first == 3) ||
        (number == SYS_clone && first == SIGCHLD) ||
        (number == SYS_prctl && first == PR_SET_PDEATHSIG) ||
        ((number == SYS_prlimit64 || number == SYS_setpriority) && first == 0) ||
        // Its third argument is 3 here: readable and writable memory.
        number == SYS_mmap || (number == SYS_seccomp && first == SECCOMP_SET_MODE_FILTER);
    if (number == SYS_brk) return SECCOMP_RET_ERRNO;
    return allowed ? SECCOMP_RET_ALLOW : SECCOMP_RET_KILL_PROCESS;
  });
}

/// Memory that can be executed is what a filter must not give, whatever the other bits are.
TEST(Filter, ZygoteMapsMemoryToReadAndWriteAlone) {
  const std::vector<sock_filter> program = compile(zygoteRules());
  for (const std::uint64_t protection : arguments) {
    const seccomp_data data{.nr = SYS_mmap,
                            .arch = nativeCalls,
                            .instruction_pointer = 0,
                            .args = {3, 3, protection, 3, 3, 3}};
    const bool allowed = static_cast<unsigned>(protection) == (PROT_READ | PROT_WRITE);
    EXPECT_EQ(run(program, data), allowed ? SECCOMP_RET_ALLOW : SECCOMP_RET_ERRNO | 12)
        << protection;
  }
}

}  // namespace
}  // namespace Keelgate::Sandbox
