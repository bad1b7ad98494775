// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/spawn.h"

#include "framework/contracts/start_step.h"

#include <sys/prctl.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <csignal>

namespace Keelgate::Sandbox {

pid_t forkSelf(unsigned namespaces) {
#ifdef KEELGATE_UNSEALED
  // A sanitizer's runtime wants to see its process fork.
  return namespaces == 0 ? fork() : -1;
#else
  const unsigned long flags = namespaces | static_cast<unsigned long>(SIGCHLD);
  return static_cast<pid_t>(syscall(SYS_clone, flags, nullptr, nullptr, nullptr, 0));
#endif
}

void dieWithParent() {
  if (prctl(PR_SET_PDEATHSIG, SIGKILL, 0, 0, 0) != 0) throw StartError(StartStep::watchProcesses);
}

}  // namespace Keelgate::Sandbox
