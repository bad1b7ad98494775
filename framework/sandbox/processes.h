// SPDX-License-Identifier: Apache-2.0
/// Processes: the one way to fork in the service, dying together, and news of deaths.
///
/// For single-threaded processes.
#pragma once

#include <sys/types.h>

namespace Keelgate::Sandbox {

/// Default handling of every signal, and none blocked. Whoever starts the service may ignore or
/// block some, and both are inherited: with SIGCHLD ignored no child could be waited for.
void resetSignals();

/// Forks, with clone's namespace flags. The C library's own fork would run handlers and make four
/// system calls more, in a process that has one thread and needs none of it.
pid_t forkSelf(unsigned namespaces);

/// Has the kernel kill this process with its parent. Must be called again after a change of
/// credentials, which resets it. The parent may have died before; the caller has to look. Throws
/// StartError.
void dieWithParent();

/// A descriptor that is readable when a child has ended. One read takes any number of deaths.
/// Throws StartError.
int watchChildren();

}  // namespace Keelgate::Sandbox
