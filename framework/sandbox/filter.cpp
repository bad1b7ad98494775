// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/filter.h"

#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/sandbox/page_scan.h"
#include "framework/sandbox/processes.h"
#include "framework/sandbox/rewinding.h"

#include <linux/userfaultfd.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>
#include <csignal>
#include <cstddef>

namespace Keelgate::Sandbox {

namespace {

constexpr unsigned channel = serviceDescriptor;

constexpr Rule worker[] = {
    {SYS_read, Verdict::allowWith, channel},
    {SYS_write, Verdict::allowWith, channel},
    {SYS_exit_group, Verdict::allow},
    // Deliberate: 0 and not ENOMEM. The C library takes the result for the new end of the heap and
    // compares it; with an error number it goes on to write past the end.
    {SYS_brk, Verdict::refuse, 0},
    // What the allocator tries next. Refused softly, so that it comes to std::bad_alloc.
    {SYS_mmap, Verdict::refuse, ENOMEM},
};

constexpr Rule zygote[] = {
    // The zygote's own loop.
    {SYS_ppoll, Verdict::allow},
    {SYS_recvmsg, Verdict::allowWith, channel},
    {SYS_sendto, Verdict::allowWith, channel},
    {SYS_shutdown, Verdict::allowWith, channel},
    {SYS_clone, Verdict::allowWith, SIGCHLD},
    {SYS_wait4, Verdict::allow},
    {SYS_kill, Verdict::allow},
    // A new worker, until it has sealed itself.
    {SYS_dup3, Verdict::allow},
    {SYS_close, Verdict::allow},
    {SYS_close_range, Verdict::allow},
    {SYS_prctl, Verdict::allowWith, PR_SET_PDEATHSIG},
    {SYS_getppid, Verdict::allow},
    {SYS_prlimit64, Verdict::allowWith, 0},
    {SYS_setpriority, Verdict::allowWith, PRIO_PROCESS},
    {SYS_mmap, Verdict::allowWith, PROT_READ | PROT_WRITE, 2},
    {SYS_mmap, Verdict::refuse, ENOMEM},
    {SYS_prctl, Verdict::allowWith, PR_SET_THP_DISABLE},
    {SYS_madvise, Verdict::allowWith, MADV_HUGEPAGE, 2},
    {SYS_seccomp, Verdict::allowWith, SECCOMP_SET_MODE_FILTER},
    // And what it is left with, which the zygote needs too.
    {SYS_read, Verdict::allow},
    {SYS_write, Verdict::allow},
    {SYS_exit_group, Verdict::allow},
    // Refused, as in a worker, so that all memory that comes is in mappings: the kernel places them
    // with more randomness.
    {SYS_brk, Verdict::refuse, 0},
};

constexpr Rule rewinding[] = {
    // For each message.
    {SYS_ptrace, Verdict::allowWith, PTRACE_CONT},
    {SYS_ptrace, Verdict::allowWith, PTRACE_GETREGSET},
    {SYS_ptrace, Verdict::allowWith, PTRACE_SETREGSET},
    {SYS_ioctl, Verdict::allowWith, scanPages, 1},
    {SYS_ioctl, Verdict::allowWith, SECCOMP_IOCTL_NOTIF_RECV, 1},
    {SYS_ioctl, Verdict::allowWith, SECCOMP_IOCTL_NOTIF_ADDFD, 1},
    {SYS_pwrite64, Verdict::allow},
    {SYS_shutdown, Verdict::allow},
    // For each worker.
    {SYS_ptrace, Verdict::allowWith, PTRACE_SETOPTIONS},
    {SYS_recvmsg, Verdict::allowWith, handoverReceiver},
    {SYS_pread64, Verdict::allow},
    {SYS_madvise, Verdict::allowWith, MADV_DONTFORK, 2},
    {SYS_munmap, Verdict::allow},
    // In a new worker, until its own filter stands.
    {SYS_ptrace, Verdict::allowWith, PTRACE_TRACEME},
    {SYS_prctl, Verdict::allowWith, PR_SET_DUMPABLE},
    {SYS_openat, Verdict::allowWith, processesDescriptor},
    {SYS_userfaultfd, Verdict::allowWith, trackingFlags},
    {SYS_ioctl, Verdict::allowWith, UFFDIO_API, 1},
    {SYS_ioctl, Verdict::allowWith, UFFDIO_REGISTER, 1},
    {SYS_sendmsg, Verdict::allowWith, handoverSender},
};

constexpr Rule returning[] = {
    {SYS_exit_group, Verdict::stopWith, 0},
    {SYS_exit_group, Verdict::noticeWith, waitingStatus},
};

constexpr sock_filter load(std::size_t offset) {
  return BPF_STMT(BPF_LD | BPF_W | BPF_ABS, static_cast<unsigned>(offset));
}
constexpr sock_filter unlessEqual(unsigned value, unsigned char skipped) {
  return BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, value, 0, skipped);
}
constexpr sock_filter answer(unsigned action) {
  return BPF_STMT(BPF_RET | BPF_K, action);
}

constexpr unsigned actionOf(const Rule& rule) {
  switch (rule.verdict) {
    case Verdict::allow:
    case Verdict::allowWith:
      break;
    case Verdict::refuse:
      return SECCOMP_RET_ERRNO | rule.number;
    case Verdict::stopWith:
      return SECCOMP_RET_TRACE;
    case Verdict::noticeWith:
      return SECCOMP_RET_USER_NOTIF;
  }
  return SECCOMP_RET_ALLOW;
}

void append(std::vector<sock_filter>& program, const Rule& rule) {
  const auto call = static_cast<unsigned>(rule.call);
  if (rule.verdict == Verdict::allow || rule.verdict == Verdict::refuse) {
    program.insert(program.end(), {unlessEqual(call, 1), answer(actionOf(rule))});
    return;
  }
  program.insert(program.end(),
                 {unlessEqual(call, 4),
                  load(offsetof(seccomp_data, args) + rule.argument * sizeof(std::uint64_t)),
                  unlessEqual(rule.number, 1), answer(actionOf(rule)),
                  // For the rules that follow.
                  load(offsetof(seccomp_data, nr))});
}

/// As the kernel has it in siginfo; the C library has no name for it.
constexpr int trappedByFilter = 1;

// How the child of a trial ends.
constexpr int trapped = 0;
constexpr int notTrapped = 1;
constexpr int refused = 2;

void noteTrap(int, siginfo_t* about, void*) {
  _exit(about->si_code == trappedByFilter && about->si_syscall == SYS_getppid ? trapped
                                                                              : notTrapped);
}

[[noreturn]] void makeForbiddenCall(std::span<const Rule> rules) try {
  struct sigaction action {};
  action.sa_sigaction = noteTrap;
  action.sa_flags = SA_SIGINFO;
  sigaction(SIGSYS, &action, nullptr);
  enforce(compile(rules, SECCOMP_RET_TRAP));
  getppid();
  _exit(notTrapped);
} catch (const StartError&) {
  _exit(refused);
}

}  // namespace

constinit const std::span<const Rule> workerRules = worker;
constinit const std::span<const Rule> zygoteRules = zygote;
constinit const std::span<const Rule> rewindingRules = rewinding;
constinit const std::span<const Rule> returningRules = returning;

std::vector<sock_filter> compile(std::span<const Rule> rules, unsigned deniedAction) {
  const sock_filter denied = answer(deniedAction);
  // The calling convention comes first: the same numbers mean other calls under another one, and
  // `int 0x80` changes it from one instruction to the next. x32 shares x86-64's, but its numbers
  // have a bit of their own, so that no table lists one of them.
  std::vector<sock_filter> program{load(offsetof(seccomp_data, arch)),
                                   BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, nativeCalls, 1, 0), denied,
                                   load(offsetof(seccomp_data, nr))};
  for (const Rule& rule : rules) append(program, rule);
  program.push_back(denied);
  return program;
}

int enforce(std::span<const sock_filter> program, unsigned flags) {
#ifndef KEELGATE_UNSEALED
  const sock_fprog handed{.len = static_cast<unsigned short>(program.size()),
                          // The kernel only reads it.
                          .filter = const_cast<sock_filter*>(program.data())};
  const long result = syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, flags, &handed);
  if (result < 0) throw StartError(StartStep::loadFilter);
  return static_cast<int>(result);
#else
  static_cast<void>(flags), static_cast<void>(program);
  return 0;
#endif
}

void proveEnforced(std::span<const Rule> rules) {
  const pid_t child = forkSelf(0);
  if (child < 0) throw StartError(StartStep::startProcesses);
  if (child == 0) makeForbiddenCall(rules);
  int status = 0;
  if (wait4(child, &status, 0, nullptr) != child) throw StartError(StartStep::startProcesses);
  if (WIFEXITED(status) && WEXITSTATUS(status) == trapped) return;
  const bool loaded = !WIFEXITED(status) || WEXITSTATUS(status) != refused;
  throw StartError(loaded ? StartStep::proveFilter : StartStep::loadFilter, 0);
}

}  // namespace Keelgate::Sandbox
