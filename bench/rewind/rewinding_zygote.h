// SPDX-License-Identifier: Apache-2.0
/// A service whose zygote sets workers back where it can, and forks where it cannot. Its client
/// sees no difference: a fork is asked for, with a channel, and its end is told.
#pragma once

#include "framework/server/keelgate_server.h"

namespace Keelgate::Rewind {

class RewindingServer : public KeelgateServer {
 public:
  static RewindingServer& service();

  /// As that of its base.
  void resume(Optional<SandboxID> sandboxID);
};

}  // namespace Keelgate::Rewind
