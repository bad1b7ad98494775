// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/processes.h"

#include "framework/contracts/start_step.h"

#include <sys/prctl.h>
#include <sys/signalfd.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <csignal>

namespace Keelgate::Sandbox {

void resetSignals() {
  for (int number = 1; number < NSIG; ++number) std::signal(number, SIG_DFL);
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
}

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

int watchChildren() {
  sigset_t deaths;
  sigemptyset(&deaths);
  sigaddset(&deaths, SIGCHLD);
  if (sigprocmask(SIG_BLOCK, &deaths, nullptr) != 0) throw StartError(StartStep::watchProcesses);
  const int signals = signalfd(-1, &deaths, SFD_CLOEXEC);
  if (signals < 0) throw StartError(StartStep::watchProcesses);
  return signals;
}

}  // namespace Keelgate::Sandbox
