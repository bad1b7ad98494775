// SPDX-License-Identifier: Apache-2.0
/// The client spawns and never forks: a fork would copy the page tables of the whole application,
/// however large, and run in a copy of it whose locks nobody will release.
#include "framework/client/launch.h"

#include "framework/client/service_location.h"
#include "framework/contracts/process.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <system_error>

namespace Keelgate {

namespace {

constexpr const char* noChannel = "No channel for the service could be made";

/// Whose limit a call has met: a limit of this process, of its user or of the whole machine.
const char* remedyFor(int error) {
  switch (error) {
    case EMFILE:
      return "; raise the limit of open files (ulimit -n)";
    case ENFILE:
      return "; raise the machine's limit of open files (fs.file-max)";
    case EAGAIN:
      return "; raise the process limit (ulimit -u, or pids.max)";
    case ENOMEM:
    case ENOBUFS:
      return "; the machine or the control group has too little memory left";
    default:
      return "";
  }
}

/// What a fresh process is given: descriptor 3, default signals, and no terminal. In a session of
/// its own neither an interrupt at the terminal ends it, nor can it type there.
class SpawnPlan {
 public:
  SpawnPlan(int control, const TrustedProgram& program)
      : program_(program), executed_("/proc/self/fd/" + std::to_string(program.file.get())) {
    // In a chroot, say. Its path will do: only root and the caller can put another file there.
    if (access(executed_.c_str(), F_OK) != 0) executed_ = program.path;
    posix_spawn_file_actions_init(&actions_);
    posix_spawn_file_actions_addclose(&actions_, 0);
    // Before the channel, which may take its number. As the lowest free number it stays marked to
    // be closed by the execution.
    if (executed_ != program.path) {
      posix_spawn_file_actions_addopen(&actions_, 0, executed_.c_str(), O_PATH | O_CLOEXEC, 0);
      executed_ = "/proc/self/fd/0";
    }
    // Also where it is 3 already: the duplicate is the one that stays open across the execution.
    posix_spawn_file_actions_adddup2(&actions_, control, serviceDescriptor);
    for (int fd = 1; fd < serviceDescriptor; ++fd) {
      posix_spawn_file_actions_addclose(&actions_, fd);
    }
    // Whatever the application forgot to mark: an open file would be a way out of the sandbox.
    posix_spawn_file_actions_addclosefrom_np(&actions_, serviceDescriptor + 1);
    posix_spawnattr_init(&attributes_);
    sigset_t signals;
    sigemptyset(&signals);
    posix_spawnattr_setsigmask(&attributes_, &signals);
    // Ignored signals would be inherited, and a launcher that ignores SIGCHLD can't wait.
    sigfillset(&signals);
    posix_spawnattr_setsigdefault(&attributes_, &signals);
    posix_spawnattr_setflags(&attributes_,
                             POSIX_SPAWN_SETSID | POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
  }
  ~SpawnPlan() {
    posix_spawn_file_actions_destroy(&actions_);
    posix_spawnattr_destroy(&attributes_);
  }
  SpawnPlan(const SpawnPlan&) = delete;
  SpawnPlan& operator=(const SpawnPlan&) = delete;

  pid_t run() const {
    String name = program_.path;
    char* const arguments[] = {name.data(), nullptr};
    // Environments hold secrets, and variables that change what a program does.
    char* const environment[] = {nullptr};
    pid_t pid = -1;
    const int error =
        posix_spawn(&pid, executed_.c_str(), &actions_, &attributes_, arguments, environment);
    // These pass with the load on the machine; the others don't.
    if (error == EAGAIN || error == ENOMEM) {
      throw shortage("The service could not be started", error);
    }
    if (error != 0) {
      throw StartFailure("The service " + program_.path + " could not be started: " +
                             errorText(error) + "; it must be an executable file for this machine",
                         false);
    }
    return pid;
  }

 private:
  const TrustedProgram& program_;
  /// By descriptor, or by path where /proc is not to be had.
  String executed_;
  posix_spawn_file_actions_t actions_;
  posix_spawnattr_t attributes_;
};

/// As which user the peer listens: of a service manager's socket, that is the manager. Whoever else
/// can put a socket there would be given the messages, and asked for the records.
void requirePeer(const String& socket, const Descriptor& control, Optional<unsigned> alsoAllowed) {
  ucred peer{};
  socklen_t size = sizeof peer;
  if (getsockopt(control.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) {
    throw shortage(noChannel, errno);
  }
  if (peer.uid == 0 || peer.uid == geteuid() || peer.uid == alsoAllowed) return;
  throw StartFailure("User " + std::to_string(peer.uid) + " listens on the socket " + socket +
                         ", who is neither root nor the caller: if that is meant, say so "
                         "(socketUser)",
                     false);
}

}  // namespace

String errorText(int error) {
  return std::generic_category().message(error);
}

StartFailure shortage(std::string_view what, int error) {
  return {String(what) + ": " + errorText(error) + remedyFor(error), true};
}

ServiceHandles launchService(const String& path, DescriptorRegistry& registry) {
  const TrustedProgram program = locateService(path, registry);
  int ends[2];
  // Packets keep their bounds: nobody can leave half a frame in the way of the next.
  if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) {
    throw shortage(noChannel, errno);
  }
  ServiceHandles handles{.control = Descriptor(registry, ends[0]), .launcher = {}};
  const Descriptor theirs(registry, ends[1]);
  if (!handles.control || !theirs) throw shortage(noChannel, errno);
  const pid_t pid = SpawnPlan(theirs.get(), program).run();
  handles.launcher = Descriptor(registry, static_cast<int>(syscall(SYS_pidfd_open, pid, 0)));
  // Where the application ignores SIGCHLD the process may be gone already: then the handshake
  // finds the channel closed, and there is nothing to signal.
  if (!handles.launcher && errno != ESRCH) {
    const int error = errno;
    // Its number is still its own: nobody has waited for it.
    kill(pid, SIGKILL);
    while (waitpid(pid, nullptr, 0) < 0 && errno == EINTR) continue;
    throw shortage("The service could not be watched", error);
  }
  return handles;
}

void signalLauncher(const Descriptor& launcher, int signal) noexcept {
  syscall(SYS_pidfd_send_signal, launcher.get(), signal, nullptr, 0);
}

void reapLauncher(const Descriptor& launcher) noexcept {
  siginfo_t ignored;
  waitid(P_PIDFD, static_cast<id_t>(launcher.get()), &ignored, WEXITED | WNOHANG);
}

ServiceHandles connectService(const String& socket, Optional<unsigned> socketUser,
                              DescriptorRegistry& registry) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (socket.size() >= sizeof address.sun_path) {
    throw StartFailure("The socket's path is longer than the system allows: " + socket, false);
  }
  // The rest of the field is zero and ends the path.
  std::memcpy(address.sun_path, socket.data(), socket.size());
  // It does not wait: a listener whose queue is full would hold the call as long as it likes.
  Descriptor control(registry, ::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!control) throw shortage(noChannel, errno);
  if (connect(control.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    const int error = errno;
    throw StartFailure("No service answers on the socket " + socket + ": " + errorText(error) +
                           "; start the unit that listens there",
                       error == EAGAIN || error == ECONNREFUSED);
  }
  requirePeer(socket, control, socketUser);
  return {.control = std::move(control), .launcher = {}};
}

}  // namespace Keelgate
