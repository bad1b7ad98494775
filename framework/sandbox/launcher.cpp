// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/steps.h"

#include "framework/contracts/layers.h"
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/sandbox/namespaces.h"
#include "framework/sandbox/processes.h"

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>
#include <csignal>

namespace Keelgate::Sandbox {

namespace {

/// A pipe: the zygote reads its layers from it, and then that the launcher still lives.
struct Tether {
  int zygoteEnd;
  int launcherEnd;
};

Tether makeTether() {
  int ends[2];
  if (pipe(ends) != 0) throw StartError(StartStep::watchProcesses);
  return {.zygoteEnd = ends[0], .launcherEnd = ends[1]};
}

sigset_t awaitedSignals() {
  sigset_t awaited;
  sigemptyset(&awaited);
  sigaddset(&awaited, SIGTERM);
  sigaddset(&awaited, SIGCHLD);
  return awaited;
}

ZygoteStart beZygote(const Tether& tether, const sigset_t& awaited) {
  close(tether.launcherEnd);
  sigprocmask(SIG_UNBLOCK, &awaited, nullptr);
  dieWithParent();
  ZygoteStart start{.layers = 0, .launcher = tether.zygoteEnd};
  // Nothing to read: the launcher died.
  if (read(tether.zygoteEnd, &start.layers, sizeof start.layers) != sizeof start.layers) _exit(0);
  return start;
}

/// What a child has without having done anything yet.
std::uint32_t layersOf(const NamespaceChild& child) {
  std::uint32_t layers = child.newUserNamespace ? mapIdentifiers(child.process) : 0;
  const bool root = geteuid() == 0 || getegid() == 0;
  if ((layers & layerUserNamespace) == 0 && !root) layers |= layerNotRoot;
  if (child.newPidNamespace) layers |= layerPidNamespace;
  return layers;
}

/// Ends as the zygote ended; 128 and the signal's number as a shell has it. SIGTERM ends the zygote
/// first. Workers that no process namespace held come to the launcher when their zygote is gone: it
/// waits for them too, or the application would find them among its children where it is what
/// collects orphans, as pid 1 of a container is.
[[noreturn]] void outlive(pid_t zygote, const sigset_t& awaited) {
  int zygoteStatus = 0;
  bool zygoteLives = true;
  bool asked = false;
  for (;;) {
    int status = 0;
    pid_t ended = 0;
    while ((ended = waitpid(-1, &status, WNOHANG)) > 0) {
      if (ended != zygote) continue;
      zygoteStatus = status;
      zygoteLives = false;
    }
    if (ended < 0) break;
    int signal = 0;
    if (sigwait(&awaited, &signal) != 0 || signal != SIGTERM) continue;
    asked = true;
    if (zygoteLives) kill(zygote, SIGKILL);
  }
  // What a service manager asked for is not a failure.
  if (asked) _exit(0);
  _exit(WIFSIGNALED(zygoteStatus) ? 128 + WTERMSIG(zygoteStatus) : WEXITSTATUS(zygoteStatus));
}

[[noreturn]] void beLauncher(pid_t zygote, std::uint32_t layers, const Tether& tether,
                             const sigset_t& awaited) {
  close(tether.zygoteEnd);
  // The zygote's alone from now on, so that its end is the channel's end.
  close(serviceDescriptor);
  // A zygote that has already failed does not listen, and its own status says why.
  std::signal(SIGPIPE, SIG_IGN);
  [[maybe_unused]] const ssize_t written = write(tether.launcherEnd, &layers, sizeof layers);
  outlive(zygote, awaited);
}

}  // namespace

ZygoteStart startZygote() {
  // From before there is a zygote, so that none of them is missed.
  const sigset_t awaited = awaitedSignals();
  sigprocmask(SIG_BLOCK, &awaited, nullptr);
  // Where it is refused, orphans go where they always went.
  prctl(PR_SET_CHILD_SUBREAPER, 1, 0, 0, 0);
  const Tether tether = makeTether();
  for (const bool userNamespace : {true, false}) {
    const NamespaceChild child = forkIntoNamespaces(userNamespace);
    if (child.process == 0) return beZygote(tether, awaited);
    const std::uint32_t layers = layersOf(child);
    const bool unmapped = child.newUserNamespace && (layers & layerUserNamespace) == 0;
    // In a namespace without maps root can become nobody else: it is better off without.
    if (!unmapped || geteuid() != 0) beLauncher(child.process, layers, tether, awaited);
    kill(child.process, SIGKILL);
    waitpid(child.process, nullptr, 0);
  }
  throw StartError(StartStep::startProcesses, 0);
}

}  // namespace Keelgate::Sandbox
