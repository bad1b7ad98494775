// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/filter.h"

#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"

#include <linux/audit.h>
#include <linux/seccomp.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <csignal>
#include <cstddef>

#ifndef __x86_64__
#error "A filter is written and proven for each architecture; so far for x86-64 alone."
#endif

namespace Keelgate::Sandbox {

namespace {

constexpr unsigned channel = serviceDescriptor;

constexpr Rule worker[] = {
    {SYS_read, Verdict::allowWithFirst, channel},
    {SYS_write, Verdict::allowWithFirst, channel},
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
    {SYS_recvmsg, Verdict::allowWithFirst, channel},
    {SYS_sendto, Verdict::allowWithFirst, channel},
    {SYS_shutdown, Verdict::allowWithFirst, channel},
    {SYS_clone, Verdict::allowWithFirst, SIGCHLD},
    {SYS_wait4, Verdict::allow},
    {SYS_kill, Verdict::allow},
    // A new worker, until it has sealed itself.
    {SYS_dup2, Verdict::allow},
    {SYS_close, Verdict::allow},
    {SYS_close_range, Verdict::allow},
    {SYS_prctl, Verdict::allowWithFirst, PR_SET_PDEATHSIG},
    {SYS_getppid, Verdict::allow},
    {SYS_prlimit64, Verdict::allowWithFirst, 0},
    {SYS_brk, Verdict::allow},
    {SYS_seccomp, Verdict::allowWithFirst, SECCOMP_SET_MODE_FILTER},
    // And what it is left with, which the zygote needs too.
    {SYS_read, Verdict::allow},
    {SYS_write, Verdict::allow},
    {SYS_exit_group, Verdict::allow},
    {SYS_mmap, Verdict::refuse, ENOMEM},
};

/// Calls of the x32 convention have numbers of their own from here, with x86-64's architecture.
constexpr unsigned firstX32Call = 0x4000'0000;

constexpr sock_filter load(std::size_t offset) {
  return BPF_STMT(BPF_LD | BPF_W | BPF_ABS, static_cast<unsigned>(offset));
}
constexpr sock_filter unlessEqual(unsigned value, unsigned char skipped) {
  return BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, value, 0, skipped);
}
constexpr sock_filter answer(unsigned action) {
  return BPF_STMT(BPF_RET | BPF_K, action);
}
constexpr sock_filter killed = answer(SECCOMP_RET_KILL_PROCESS);

void append(std::vector<sock_filter>& program, const Rule& rule) {
  const auto call = static_cast<unsigned>(rule.call);
  switch (rule.verdict) {
    case Verdict::allow:
      program.insert(program.end(), {unlessEqual(call, 1), answer(SECCOMP_RET_ALLOW)});
      return;
    case Verdict::refuse:
      program.insert(program.end(),
                     {unlessEqual(call, 1), answer(SECCOMP_RET_ERRNO | rule.number)});
      return;
    case Verdict::allowWithFirst:
      // x86-64 is little-endian: the half that the kernel reads comes first.
      program.insert(program.end(),
                     {unlessEqual(call, 4), load(offsetof(seccomp_data, args)),
                      unlessEqual(rule.number, 1), answer(SECCOMP_RET_ALLOW), killed});
      return;
  }
}

}  // namespace

std::span<const Rule> workerRules() noexcept {
  return worker;
}
std::span<const Rule> zygoteRules() noexcept {
  return zygote;
}

std::vector<sock_filter> compile(std::span<const Rule> rules) {
  // The architecture comes first: the same numbers mean other calls under another one, and
  // `int 0x80` changes it from one instruction to the next.
  std::vector<sock_filter> program{load(offsetof(seccomp_data, arch)),
                                   BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, AUDIT_ARCH_X86_64, 1, 0),
                                   killed,
                                   load(offsetof(seccomp_data, nr)),
                                   BPF_JUMP(BPF_JMP | BPF_JGE | BPF_K, firstX32Call, 0, 1),
                                   killed};
  for (const Rule& rule : rules) append(program, rule);
  program.push_back(killed);
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

}  // namespace Keelgate::Sandbox
