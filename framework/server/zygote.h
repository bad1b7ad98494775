// SPDX-License-Identifier: Apache-2.0
/// The zygote: sealed once, it has a fresh worker for each request of its client, forked or
/// rewound, and never reads a message itself, so that it stays worth forking.
#pragma once

#include "framework/protocol/frames.h"
#include "framework/sandbox/seal.h"
#include "framework/server/keelgate_server.h"
#include "framework/server/worker_list.h"

#include <cstdint>

namespace Keelgate {

/// For one thread, and for the only one of its process: a fork copies no other, and what another
/// held locked would stay locked in every worker.
class Zygote {
 public:
  /// In a process that has been sealed so.
  Zygote(const KeelgateServer& server, Sandbox::ZygoteSeal seal)
      : server_(server),
        seal_(std::move(seal)),
        workerSeal_{.parent = seal_.process, .filter = seal_.workerFilter} {}

  /// Says that it is ready, and serves until the client or the launcher goes. Throws StartError
  /// when the client breaks the protocol.
  void serve();

 private:
  struct Received {
    Protocol::ControlFrame frame;
    /// Ours to close, or Protocol::noDescriptor.
    int descriptor;
  };

  void greet();
  /// The next frame, or nothing when the client has gone.
  static Optional<Received> receive();
  /// False when the client has gone.
  bool takeFrame();
  /// Gives a fresh worker to a slot.
  void fork(std::uint32_t slot, int channel);
  void forkOnce(std::uint32_t slot, int channel);
  /// A worker that has no channel yet and is rewound whenever it ends.
  void forkToRewind();
  /// From here on it forks and does nothing else.
  void renounceRewinding();
  void kill(std::uint32_t slot);
  /// Tells the client of every worker that has ended.
  void reap();

  const KeelgateServer& server_;
  Sandbox::ZygoteSeal seal_;
  /// How many a worker may be given.
  std::uint64_t messages_ = 0;
  /// Of the next worker.
  Sandbox::WorkerSeal workerSeal_;
  WorkerList workers_;
};

}  // namespace Keelgate
