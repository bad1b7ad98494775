// SPDX-License-Identifier: Apache-2.0
/// Where the program hands over for good.
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/control_frames.h"
#include "framework/sandbox/seal.h"
#include "framework/server/keelgate_server.h"
#include "framework/server/zygote.h"

#include <sys/prctl.h>
#include <sys/socket.h>
#include <unistd.h>
#include <cstdio>

namespace Keelgate {

namespace {

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

}  // namespace

void KeelgateServer::resume(Optional<SandboxID> sandboxID) try {
  if (!sandboxID) return;
  if (!startedByClient()) {
    std::fputs(
        "VespKeelgateService is started by its client, with a channel as descriptor 3; "
        "run keelgate instead.\n",
        stderr);
    _exit(Protocol::refusedExitStatus);
  }
  // Executed by its descriptor it would be called after that.
  prctl(PR_SET_NAME, "VespKeelgateService");
  // Before the first frame is read, though the client is trusted: whoever stands at the other end
  // of an activated socket is whoever may connect to it.
  Zygote(*this, Sandbox::sealZygote()).serve();
  // Its workers go with it.
  _exit(0);
} catch (const StartError& why) {
  refuse(why);
}

}  // namespace Keelgate
