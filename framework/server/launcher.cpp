// SPDX-License-Identifier: Apache-2.0
/// Where the program hands over for good. The launcher makes the zygote and outlives it by nothing:
/// it exists because somebody outside has to write the maps of a user namespace, and because the
/// client needs a child of its own to watch and to kill.
#include "framework/contracts/layers.h"
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/control_frames.h"
#include "framework/sandbox/credentials.h"
#include "framework/sandbox/descriptors.h"
#include "framework/sandbox/namespaces.h"
#include "framework/sandbox/spawn.h"
#include "framework/server/zygote.h"

#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>
#include <csignal>
#include <cstdio>

namespace Keelgate {

namespace {

/// The one who starts us may ignore or block signals, and both are inherited: with SIGCHLD ignored
/// no child could be waited for.
void resetSignals() {
  for (int number = 1; number < NSIG; ++number) std::signal(number, SIG_DFL);
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
}

/// A shell that starts the service by hand has no packet socket there. Without this check it would
/// wait for ever, or read from somebody's file.
bool startedByClient() {
  int type = 0;
  socklen_t size = sizeof type;
  return getsockopt(serviceDescriptor, SOL_SOCKET, SO_TYPE, &type, &size) == 0 &&
         type == SOCK_SEQPACKET;
}

/// The client shows the reason as a sentence with what to do about it, so it must arrive.
[[noreturn]] void refuse(const StartError& why) {
  const auto last = Protocol::makeControlFrame(
      Protocol::ControlKind::refused, 0,
      {static_cast<std::uint64_t>(why.step), static_cast<std::uint64_t>(why.error)});
  static_cast<void>(Protocol::sendControl(serviceDescriptor, last, Protocol::noDescriptor,
                                          Protocol::Waiting::yes));
  // Whoever closes a channel with unread packets in it resets it, and the client would see the
  // reset in place of the last frame. So none may come any more, and those that came are read.
  shutdown(serviceDescriptor, SHUT_RD);
  msghdr discarded{};
  while (recvmsg(serviceDescriptor, &discarded, 0) > 0 || (discarded.msg_flags & MSG_TRUNC) != 0) {
    discarded = {};
  }
  _exit(Protocol::refusedExitStatus);
}

/// A pipe of which the launcher holds the one end as long as it lives, and the zygote the other.
struct Tether {
  int zygoteEnd;
  int launcherEnd;
};

Tether makeTether() {
  int ends[2];
  if (pipe(ends) != 0) throw StartError(StartStep::watchProcesses);
  return {.zygoteEnd = ends[0], .launcherEnd = ends[1]};
}

/// Blocked from before there is a zygote, so that none of them is missed; the zygote unblocks them.
sigset_t awaitedSignals() {
  sigset_t awaited;
  sigemptyset(&awaited);
  sigaddset(&awaited, SIGTERM);
  sigaddset(&awaited, SIGCHLD);
  return awaited;
}

[[noreturn]] void beZygote(const KeelgateServer& server, const Tether& tether) try {
  close(tether.launcherEnd);
  const sigset_t awaited = awaitedSignals();
  sigprocmask(SIG_UNBLOCK, &awaited, nullptr);
  Sandbox::dieWithParent();
  std::uint32_t layers = 0;
  // Nothing to read: the launcher died.
  if (read(tether.zygoteEnd, &layers, sizeof layers) != sizeof layers) _exit(0);
  Zygote(server, tether.zygoteEnd, layers).serve();
  // Its workers go with it.
  _exit(0);
} catch (const StartError& why) {
  refuse(why);
}

/// What a child has without having done anything yet.
std::uint32_t giveLayers(const Sandbox::Birth& birth, bool groupsLeft) {
  std::uint32_t layers = birth.newUserNamespace ? Sandbox::mapIdentifiers(birth.child) : 0;
  const bool root = geteuid() == 0 || getegid() == 0;
  if ((layers & layerUserNamespace) == 0 && !root) layers |= layerNotRoot;
  if (birth.newPidNamespace) layers |= layerPidNamespace;
  if (groupsLeft) layers |= layerNoSupplementaryGroups;
  return layers;
}

/// Ends as the zygote ended; 128 and the signal's number as a shell has it. SIGTERM ends the zygote
/// first. Workers that no process namespace held come to the launcher when their zygote is gone: it
/// waits for them too, or the application would find them among its children where it is what
/// collects orphans, as pid 1 of a container is.
[[noreturn]] void outlive(pid_t zygote) {
  const sigset_t awaited = awaitedSignals();
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
  // What a service manager asked for is no failure.
  if (asked) _exit(0);
  _exit(WIFSIGNALED(zygoteStatus) ? 128 + WTERMSIG(zygoteStatus) : WEXITSTATUS(zygoteStatus));
}

/// The zygote, waiting to be told its layers, and what these are.
struct Start {
  pid_t zygote;
  std::uint32_t layers;
};

Start startZygote(const KeelgateServer& server, const Tether& tether, bool groupsLeft) {
  for (const bool userNamespace : {true, false}) {
    const Sandbox::Birth birth = Sandbox::forkIntoNamespaces(userNamespace);
    if (birth.child == 0) beZygote(server, tether);
    const std::uint32_t layers = giveLayers(birth, groupsLeft);
    const bool unmapped = birth.newUserNamespace && (layers & layerUserNamespace) == 0;
    // In a namespace without maps root can become nobody else: it is better off without.
    if (!unmapped || geteuid() != 0) return {.zygote = birth.child, .layers = layers};
    kill(birth.child, SIGKILL);
    waitpid(birth.child, nullptr, 0);
  }
  throw StartError(StartStep::startProcesses, 0);
}

[[noreturn]] void launch(const KeelgateServer& server) try {
  resetSignals();
  // Executed by its descriptor it would be called after that.
  prctl(PR_SET_NAME, "VespKeelgateService");
  // Before anything is made: what the one who starts us left open must not reach a worker.
  Sandbox::keepOnly(serviceDescriptor);
  const bool groupsLeft = Sandbox::leaveGroups();
  const sigset_t awaited = awaitedSignals();
  sigprocmask(SIG_BLOCK, &awaited, nullptr);
  // Where it is refused, orphans go where they always went.
  prctl(PR_SET_CHILD_SUBREAPER, 1, 0, 0, 0);
  const Tether tether = makeTether();
  const Start start = startZygote(server, tether, groupsLeft);
  close(tether.zygoteEnd);
  // The zygote's alone from now on, so that its end is the channel's end.
  close(serviceDescriptor);
  // One that has already refused does not listen, and its own status says why.
  std::signal(SIGPIPE, SIG_IGN);
  if (write(tether.launcherEnd, &start.layers, sizeof start.layers) < 0 && errno != EPIPE) {
    _exit(Protocol::refusedExitStatus);
  }
  outlive(start.zygote);
} catch (const StartError& why) {
  refuse(why);
}

}  // namespace

void KeelgateServer::resume(Optional<SandboxID> sandboxID) {
  if (!sandboxID) return;
  if (!startedByClient()) {
    std::fputs(
        "VespKeelgateService is started by its client, with a channel as descriptor 3; "
        "run keelgate instead.\n",
        stderr);
    _exit(Protocol::refusedExitStatus);
  }
  launch(*this);
}

}  // namespace Keelgate
