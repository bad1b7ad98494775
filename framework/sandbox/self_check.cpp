// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/self_check.h"

#include "framework/contracts/start_step.h"
#include "framework/sandbox/filter.h"
#include "framework/sandbox/spawn.h"

#include <sys/wait.h>
#include <unistd.h>
#include <csignal>

namespace Keelgate::Sandbox {

namespace {

[[noreturn]] void makeForbiddenCall(std::span<const sock_filter> workerFilter) {
  try {
    enforce(workerFilter);
    getppid();
  } catch (const StartError&) {
    _exit(1);
  }
  _exit(0);
}

}  // namespace

void proveFilter(std::span<const sock_filter> workerFilter) {
  const pid_t child = forkSelf(0);
  if (child < 0) throw StartError(StartStep::startProcesses);
  if (child == 0) makeForbiddenCall(workerFilter);
  int status = 0;
  if (wait4(child, &status, 0, nullptr) != child) throw StartError(StartStep::startProcesses);
  if (WIFEXITED(status) && WEXITSTATUS(status) == 1) throw StartError(StartStep::loadFilter, 0);
  if (!WIFSIGNALED(status) || WTERMSIG(status) != SIGSYS) {
    throw StartError(StartStep::proveFilter, 0);
  }
}

}  // namespace Keelgate::Sandbox
