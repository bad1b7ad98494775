// SPDX-License-Identifier: Apache-2.0
/// The system call filter: a table to be read aloud, and what makes the kernel's program of it.
///
/// What a table does not list kills the process, and so does every call of another architecture or
/// calling convention. Everything here is single-threaded; a compiled filter may be shared.
#pragma once

#include <linux/audit.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <bit>
#include <span>
#include <vector>

namespace Keelgate::Sandbox {

/// The calling convention that is let in. Each architecture has others with numbers of their own:
/// `int 0x80` on x86-64, 32-bit programs on arm64. A filter need not know more of its architecture:
/// the tables have the kernel's own names, and none that only some architectures have.
#if defined __x86_64__
inline constexpr unsigned nativeCalls = AUDIT_ARCH_X86_64;
#elif defined __aarch64__
inline constexpr unsigned nativeCalls = AUDIT_ARCH_AARCH64;
#elif defined KEELGATE_UNSEALED
// For tests of what reads messages, on machines of any kind.
inline constexpr unsigned nativeCalls = 0;
#else
#error "A filter is proven for each architecture; so far for x86-64 and arm64."
#endif

#ifndef KEELGATE_UNSEALED
/// A filter reads the half of an argument that comes first in memory.
static_assert(std::endian::native == std::endian::little);
#endif

enum class Verdict {
  /// The call is made.
  allow,
  /// The call is made when its argument is `number`, which the kernel reads as 32 bits. With
  /// another argument the rules that follow decide, here and below.
  allowWith,
  /// The call is not made and reports `number` as its errno; 0 stands for a result of 0.
  refuse,
  /// With this argument the process stops before the call, and its tracer decides.
  stopWith,
  /// With this argument it waits in the call, and whoever listens to the filter decides.
  noticeWith,
};

struct Rule {
  int call;
  Verdict verdict;
  unsigned number = 0;
  /// For those that look at an argument: which, from 0.
  unsigned argument = 0;
};

/// All that a worker can do from before it reads the first byte of a message: C1.
extern const std::span<const Rule> workerRules;

/// All that the zygote can do, and a worker until its own filter stands.
extern const std::span<const Rule> zygoteRules;

/// What a zygote that rewinds workers can do besides, and such a worker until its own filter
/// stands.
extern const std::span<const Rule> rewindingRules;

/// What becomes of such a worker's ends; its own filter decides about all other calls.
extern const std::span<const Rule> returningRules;

/// The kernel's program for a table. `denied` is what it answers to calls that are not listed.
std::vector<sock_filter> compile(std::span<const Rule> rules,
                                 unsigned denied = SECCOMP_RET_KILL_PROCESS);

/// Puts the calling thread under a program, in addition to those that it is under, for good;
/// no_new_privs must be set. With SECCOMP_FILTER_FLAG_NEW_LISTENER it returns the descriptor that
/// the program's notices are read from. Throws StartError.
int enforce(std::span<const sock_filter> program, unsigned flags = 0);

/// Has a child of the calling process make a call that a table forbids, under a trial copy of its
/// program. An emulation of the kernel, or a kernel told to ignore filters, accepts filters and
/// enforces nothing. Throws StartError when the call is made. The copy traps the call instead of
/// killing the process: a kill is what the kernel's log records as an attempt to break out.
void proveEnforced(std::span<const Rule> rules);

}  // namespace Keelgate::Sandbox
