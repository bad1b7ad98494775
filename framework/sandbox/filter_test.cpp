// SPDX-License-Identifier: Apache-2.0
/// The compiled filters, run by an interpreter of our own over every number and the edges of the
/// argument, against what is said of them in words.
#include "framework/sandbox/filter.h"

#include "framework/sandbox/architecture.h"
#include "framework/sandbox/page_scan.h"
#include "framework/sandbox/rewinding.h"

#include <gtest/gtest.h>
#include <linux/seccomp.h>
#include <linux/userfaultfd.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <algorithm>
#include <array>
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

using Arguments = std::array<std::uint64_t, 6>;

/// What a rule may name, and what is near.
std::vector<std::uint64_t> arguments() {
  std::vector<std::uint64_t> all{PTRACE_SETOPTIONS, PTRACE_GETREGSET, PTRACE_SETREGSET,
                                 PTRACE_SEIZE,      trackingFlags,    waitingStatus,
                                 PR_SET_THP_DISABLE};
  for (const std::uint64_t command :
       {scanPages, SECCOMP_IOCTL_NOTIF_RECV, UFFDIO_COPY, SECCOMP_IOCTL_NOTIF_ADDFD,
        SECCOMP_IOCTL_NOTIF_SEND, UFFDIO_API, UFFDIO_REGISTER}) {
    all.push_back(command);
  }
  for (std::uint64_t small = 0; small < 20; ++small) all.push_back(small);
  for (const std::uint64_t high : {0xffff'fffful, 0x1'0000'0003ul, 0x3'0000'0000ul, ~0ul}) {
    all.push_back(high);
  }
  return all;
}

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

/// One argument at a time has a value of the table, and the others are something else.
template <class Check>
void forAllCalls(Check&& check) {
  const std::vector<std::uint64_t> values = arguments();
  for (const unsigned arch : architectures) {
    for (const int number : numbers()) {
      for (const std::uint64_t argument : values) {
        const bool known = arch == nativeCalls && number < 512;
        for (std::size_t position = 0; position < (known ? 3 : 1); ++position) {
          seccomp_data data{.nr = number, .arch = arch, .instruction_pointer = 0, .args = {}};
          std::fill(std::begin(data.args), std::end(data.args), ~argument);
          data.args[position] = argument;
          check(data);
          if (testing::Test::HasFailure()) return;
        }
      }
    }
  }
}

/// `expected` is told the call and the lower half of its arguments.
template <class Expected>
void expectEverywhere(std::span<const Rule> rules, Expected&& expected) {
  const std::vector<sock_filter> program = compile(rules);
  const std::vector<sock_filter> trial = compile(rules, SECCOMP_RET_TRAP);
  forAllCalls([&](const seccomp_data& data) {
    std::array<unsigned, 3> low{};
    for (std::size_t i = 0; i < low.size(); ++i) low[i] = static_cast<unsigned>(data.args[i]);
    const unsigned wanted =
        data.arch == nativeCalls ? expected(data.nr, low) : SECCOMP_RET_KILL_PROCESS;
    EXPECT_EQ(run(program, data), wanted) << data.arch << ' ' << data.nr << ' ' << low[0];
    // The trial copy decides the same, and traps what the other kills for.
    const unsigned tried = wanted == SECCOMP_RET_KILL_PROCESS ? SECCOMP_RET_TRAP : wanted;
    EXPECT_EQ(run(trial, data), tried) << data.arch << ' ' << data.nr << ' ' << low[0];
  });
}

using Low = std::array<unsigned, 3>;

bool isOneOf(std::uint64_t value, std::initializer_list<std::uint64_t> values) {
  return std::find(values.begin(), values.end(), value) != values.end();
}

TEST(Filter, C1WorkerReadsWritesAndExits) {
  expectEverywhere(workerRules(), [](int number, const Low& low) -> unsigned {
    if ((number == SYS_read || number == SYS_write) && low[0] == 3) return SECCOMP_RET_ALLOW;
    if (number == SYS_exit_group) return SECCOMP_RET_ALLOW;
    if (number == SYS_brk) return SECCOMP_RET_ERRNO;
    if (number == SYS_mmap) return SECCOMP_RET_ERRNO | 12;
    return SECCOMP_RET_KILL_PROCESS;
  });
}

bool isZygotes(int number, const Low& low) {
  switch (number) {
    case SYS_recvmsg:
    case SYS_sendto:
    case SYS_shutdown:
      return low[0] == 3;
    case SYS_clone:
      return low[0] == SIGCHLD;
    case SYS_prctl:
      return isOneOf(low[0], {PR_SET_PDEATHSIG, PR_SET_THP_DISABLE});
    case SYS_madvise:
      return low[2] == MADV_HUGEPAGE;
    case SYS_prlimit64:
    case SYS_setpriority:
      return low[0] == 0;
    case SYS_mmap:
      // Memory that can be executed is what a filter must not give.
      return low[2] == (PROT_READ | PROT_WRITE);
    case SYS_seccomp:
      return low[0] == SECCOMP_SET_MODE_FILTER;
    default:
      return isOneOf(static_cast<unsigned>(number),
                     {SYS_ppoll, SYS_wait4, SYS_kill, SYS_dup3, SYS_close, SYS_close_range,
                      SYS_getppid, SYS_read, SYS_write, SYS_exit_group});
  }
}
bool isRewindings(int number, const Low& low) {
  switch (number) {
    case SYS_ptrace:
      return isOneOf(low[0], {PTRACE_TRACEME, PTRACE_CONT, PTRACE_SETOPTIONS, PTRACE_GETREGSET,
                              PTRACE_SETREGSET});
    case SYS_ioctl:
      return isOneOf(low[1], {scanPages, SECCOMP_IOCTL_NOTIF_RECV, SECCOMP_IOCTL_NOTIF_ADDFD,
                              UFFDIO_API, UFFDIO_REGISTER});
    case SYS_recvmsg:
      return low[0] == handoverReceiver;
    case SYS_sendmsg:
      return low[0] == handoverSender;
    case SYS_openat:
      return low[0] == processesDescriptor;
    case SYS_prctl:
      return low[0] == PR_SET_DUMPABLE;
    case SYS_userfaultfd:
      return low[0] == trackingFlags;
    case SYS_madvise:
      return low[2] == MADV_DONTFORK;
    default:
      return isOneOf(static_cast<unsigned>(number),
                     {SYS_pread64, SYS_pwrite64, SYS_munmap, SYS_shutdown});
  }
}

TEST(Filter, ZygoteHasNoCallThatOpensOrExecutes) {
  for (const bool rewinds : {false, true}) {
    std::vector<Rule> rules(zygoteRules().begin(), zygoteRules().end());
    if (rewinds) rules.insert(rules.end(), rewindingRules().begin(), rewindingRules().end());
    expectEverywhere(rules, [&](int number, const Low& low) -> unsigned {
      if (isZygotes(number, low) || (rewinds && isRewindings(number, low))) {
        return SECCOMP_RET_ALLOW;
      }
      if (number == SYS_brk) return SECCOMP_RET_ERRNO;
      return number == SYS_mmap ? SECCOMP_RET_ERRNO | 12 : SECCOMP_RET_KILL_PROCESS;
    });
  }
}

TEST(Filter, OfAWorkerThatReturnsOnlyTwoEndsAreKept) {
  const std::vector<sock_filter> program = compile(returningRules(), SECCOMP_RET_ALLOW);
  forAllCalls([&](const seccomp_data& data) {
    unsigned wanted = SECCOMP_RET_ALLOW;
    if (data.arch == nativeCalls && data.nr == SYS_exit_group) {
      const auto status = static_cast<unsigned>(data.args[0]);
      if (status == 0) wanted = SECCOMP_RET_TRACE;
      if (status == waitingStatus) wanted = SECCOMP_RET_USER_NOTIF;
    }
    EXPECT_EQ(run(program, data), wanted) << data.arch << ' ' << data.nr << ' ' << data.args[0];
  });
}

}  // namespace
}  // namespace Keelgate::Sandbox
