// SPDX-License-Identifier: Apache-2.0
/// Processes: the one way to fork in the service, and dying together.
///
/// For single-threaded processes.
#pragma once

#include <sys/types.h>

namespace Keelgate::Sandbox {

/// Forks, with clone's namespace flags. The C library's own fork would run handlers and make four
/// system calls more, in a process that has one thread and needs none of it.
pid_t forkSelf(unsigned namespaces);

/// Has the kernel kill this process with its parent. Must be called again after a change of
/// credentials, which resets it. The parent may have died before; the caller has to look.
void dieWithParent();

}  // namespace Keelgate::Sandbox
