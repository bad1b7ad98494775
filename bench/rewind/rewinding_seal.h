// SPDX-License-Identifier: Apache-2.0
/// The seal of a zygote that traces its workers: that of the product, but for what tracing takes.
#pragma once

#include "framework/sandbox/seal.h"

namespace Keelgate::Rewind {

struct RewindingSeal {
  Sandbox::ZygoteSeal zygote;
  /// The processes of this namespace, and nothing else of a machine.
  int proc;
  /// Where the ends of workers are told.
  int notices;
  /// What a worker has for a channel when it has ended: nobody is at the other end.
  int nowhere;
};

/// Called in the process that the client started; returns in the zygote. Throws StartError.
RewindingSeal sealRewindingZygote();

}  // namespace Keelgate::Rewind
