// SPDX-License-Identifier: Apache-2.0
/// The compiled filters, run by an interpreter of our own over every number and the edges of the
/// argument, against what is said of them in words.
#include "framework/sandbox/filter.h"

#include "framework/contracts/start_step.h"
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

/// A call, and the values that an argument may have; anything where there are none.
struct Allowed {
  int call;
  std::vector<std::uint64_t> values = {};
  std::size_t argument = 0;

  [[nodiscard]] bool matches(const seccomp_data& data) const {
    // The upper half says nothing: the kernel reads an int.
    const unsigned low = static_cast<unsigned>(data.args[argument]);
    return data.nr == call && (values.empty() || std::ranges::count(values, low) > 0);
  }
};

void expectAllowed(std::span<const Rule> rules, const std::vector<Allowed>& allowed) {
  const std::vector<sock_filter> program = compile(rules);
  const std::vector<sock_filter> trial = compile(rules, SECCOMP_RET_TRAP);
  forAllCalls([&](const seccomp_data& data) {
    const auto matches = [&](const Allowed& row) {
      return row.matches(data);
    };
    const bool isRefused = data.nr == SYS_brk || data.nr == SYS_mmap;
    const unsigned refused = SECCOMP_RET_ERRNO | (data.nr == SYS_brk ? 0 : ENOMEM);
    const unsigned wanted = data.arch != nativeCalls                ? SECCOMP_RET_KILL_PROCESS
                            : std::ranges::any_of(allowed, matches) ? SECCOMP_RET_ALLOW
                            : isRefused                             ? refused
                                                                    : SECCOMP_RET_KILL_PROCESS;
    EXPECT_EQ(run(program, data), wanted) << data.arch << ' ' << data.nr << ' ' << data.args[0];
    // The trial copy decides the same, and traps what the other kills for.
    const unsigned tried = wanted == SECCOMP_RET_KILL_PROCESS ? SECCOMP_RET_TRAP : wanted;
    EXPECT_EQ(run(trial, data), tried) << data.arch << ' ' << data.nr << ' ' << data.args[0];
  });
}

TEST(Filter, C1WorkerReadsWritesAndExits) {
  expectAllowed(workerRules, {{SYS_read, {3}}, {SYS_write, {3}}, {SYS_exit_group}});
}

TEST(Filter, ZygoteHasNoCallThatOpensOrExecutes) {
  // Memory that can be executed is what a filter must not give.
  std::vector<Allowed> allowed{{SYS_recvmsg, {3}},
                               {SYS_sendto, {3}},
                               {SYS_shutdown, {3}},
                               {SYS_clone, {SIGCHLD}},
                               {SYS_prctl, {PR_SET_PDEATHSIG, PR_SET_THP_DISABLE}},
                               {SYS_madvise, {MADV_HUGEPAGE}, 2},
                               {SYS_prlimit64, {0}},
                               {SYS_setpriority, {0}},
                               {SYS_mmap, {PROT_READ | PROT_WRITE}, 2},
                               {SYS_seccomp, {SECCOMP_SET_MODE_FILTER}}};
  for (const int call : {SYS_ppoll, SYS_wait4, SYS_kill, SYS_dup3, SYS_close, SYS_close_range,
                         SYS_getppid, SYS_read, SYS_write, SYS_exit_group}) {
    allowed.push_back({call});
  }
  std::vector<Rule> rules(zygoteRules.begin(), zygoteRules.end());
  expectAllowed(rules, allowed);
  for (const Allowed& more : std::initializer_list<Allowed>{
           {SYS_ptrace,
            {PTRACE_TRACEME, PTRACE_CONT, PTRACE_SETOPTIONS, PTRACE_GETREGSET, PTRACE_SETREGSET}},
           {SYS_ioctl,
            {scanPages, SECCOMP_IOCTL_NOTIF_RECV, SECCOMP_IOCTL_NOTIF_ADDFD, UFFDIO_API,
             UFFDIO_REGISTER},
            1},
           {SYS_recvmsg, {handoverReceiver}},
           {SYS_sendmsg, {handoverSender}},
           {SYS_openat, {processesDescriptor}},
           {SYS_prctl, {PR_SET_DUMPABLE}},
           {SYS_userfaultfd, {trackingFlags}},
           {SYS_madvise, {MADV_DONTFORK}, 2},
           {SYS_pread64},
           {SYS_pwrite64},
           {SYS_munmap},
           {SYS_shutdown}}) {
    allowed.push_back(more);
  }
  rules.insert(rules.end(), rewindingRules.begin(), rewindingRules.end());
  expectAllowed(rules, allowed);
}

TEST(Filter, OfAWorkerThatReturnsOnlyTwoEndsAreKept) {
  const std::vector<sock_filter> program = compile(returningRules, SECCOMP_RET_ALLOW);
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

#ifndef KEELGATE_UNSEALED
TEST(Filter, IsProvedToBeInForce) {
  prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
  const auto stepOf = [](std::vector<Rule> rules) {
    try {
      proveEnforced(rules);
      return StartStep{};
    } catch (const StartError& error) {
      EXPECT_EQ(error.error, 0);
      return error.step;
    }
  };
  constexpr Rule call{SYS_getppid, Verdict::allow};
  constexpr Rule end{SYS_exit_group, Verdict::allow};
  EXPECT_EQ(stepOf({workerRules.begin(), workerRules.end()}), StartStep{});
  EXPECT_EQ(stepOf({call, end}), StartStep::proveFilter);
  // It cannot even say that the call was made, or is trapped for another one.
  EXPECT_EQ(stepOf({call}), StartStep::proveFilter);
  for (const unsigned status : {0U, 2U}) {
    EXPECT_EQ(stepOf({call, {SYS_exit_group, Verdict::allowWith, status}}), StartStep::proveFilter);
  }
  // A kernel that takes no filter: too long for it.
  EXPECT_EQ(stepOf(std::vector<Rule>(3000, end)), StartStep::loadFilter);
}
#endif

}  // namespace
}  // namespace Keelgate::Sandbox
