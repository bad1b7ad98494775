// SPDX-License-Identifier: Apache-2.0
/// The zygote: sealed once, it forks a worker for each request of its client and never reads a
/// message itself, so that it stays worth forking.
#pragma once

#include "framework/protocol/frames.h"
#include "framework/server/keelgate_server.h"
#include "framework/server/worker.h"

#include <sys/types.h>
#include <cstdint>
#include <vector>

namespace Keelgate {

/// For one thread, and for the only one of its process: a fork copies no other, and what another
/// held locked would stay locked in every worker.
class Zygote {
 public:
  /// `tether` hangs up when the launcher dies. `given` are the layers (Layer) that the
  /// launcher gave this process.
  Zygote(const KeelgateServer& server, int tether, std::uint32_t given)
      : server_(server), tether_(tether), given_(given) {}

  /// Seals this process, says that it is ready, and serves until the client or the launcher goes.
  /// Throws StartError when the seal is incomplete or the client breaks the protocol. Only
  /// for a process with one thread.
  void serve();

 private:
  /// Until it is reaped: its number cannot be another's before that.
  struct Child {
    std::uint32_t slot;
    pid_t process;
  };

  struct Received {
    Protocol::ControlFrame frame;
    /// Ours to close, or Protocol::noDescriptor.
    int descriptor;
  };

  void greet(std::uint32_t layers);
  /// The next frame, or nothing when the client has gone.
  static Optional<Received> receive();
  /// False when the client has gone.
  bool takeFrame();
  void fork(std::uint32_t slot, int channel);
  void kill(std::uint32_t slot) const;
  /// Tells the client of every worker that has ended.
  void reap();

  const KeelgateServer& server_;
  int tether_;
  std::uint32_t given_;
  /// What the next worker is forked with.
  WorkerOptions options_{};
  std::vector<Child> children_;
};

}  // namespace Keelgate
