// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/filter.h"

#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/sandbox/architecture.h"
#include "framework/sandbox/processes.h"

#include <sys/mman.h>
#include <sys/prctl.h>
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
    {SYS_mmap, Verdict::allowWith, PROT_READ | PROT_WRITE, 2, ENOMEM},
    {SYS_seccomp, Verdict::allowWith, SECCOMP_SET_MODE_FILTER},
    // And what it is left with, which the zygote needs too.
    {SYS_read, Verdict::allow},
    {SYS_write, Verdict::allow},
    {SYS_exit_group, Verdict::allow},
    // Refused, as in a worker, so that all memory that comes is in mappings: the kernel places them
    // with more randomness.
    {SYS_brk, Verdict::refuse, 0},
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

void append(std::vector<sock_filter>& program, const Rule& rule, sock_filter denied) {
  const auto call = static_cast<unsigned>(rule.call);
  switch (rule.verdict) {
    case Verdict::allow:
      program.insert(program.end(), {unlessEqual(call, 1), answer(SECCOMP_RET_ALLOW)});
      return;
    case Verdict::refuse:
      program.insert(program.end(),
                     {unlessEqual(call, 1), answer(SECCOMP_RET_ERRNO | rule.number)});
      return;
    case Verdict::allowWith:
      program.insert(program.end(),
                     {unlessEqual(call, 4),
                      load(offsetof(seccomp_data, args) + rule.argument * sizeof(std::uint64_t)),
                      unlessEqual(rule.number, 1), answer(SECCOMP_RET_ALLOW),
                      rule.error == 0 ? denied : answer(SECCOMP_RET_ERRNO | rule.error)});
      return;
  }
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

std::span<const Rule> workerRules() noexcept {
  return worker;
}
std::span<const Rule> zygoteRules() noexcept {
  return zygote;
}

std::vector<sock_filter> compile(std::span<const Rule> rules, unsigned deniedAction) {
  const sock_filter denied = answer(deniedAction);
  // The calling convention comes first: the same numbers mean other calls under another one, and
  // `int 0x80` changes it from one instruction to the next. x32 shares x86-64's, but its numbers
  // have a bit of their own, so that no table lists one of them.
  std::vector<sock_filter> program{load(offsetof(seccomp_data, arch)),
                                   BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, nativeCalls, 1, 0), denied,
                                   load(offsetof(seccomp_data, nr))};
  for (const Rule& rule : rules) append(program, rule, denied);
  program.push_back(denied);
  return program;
}

void enforce(std::span<const sock_filter> program) {
#ifndef KEELGATE_UNSEALED
  const sock_fprog handed{.len = static_cast<unsigned short>(program.size()),
                          // The kernel only reads it.
                          .filter = const_cast<sock_filter*>(program.data())};
  if (syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, 0, &handed) != 0) {
    throw StartError(StartStep::loadFilter);
  }
#else
  static_cast<void>(program);
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
