// SPDX-License-Identifier: Apache-2.0
/// The launcher: the process that the client started. It stays behind, outside of the sandbox,
/// because somebody there has to write the maps of a user namespace, and because the client needs a
/// child of its own to watch and to kill.
///
/// For single-threaded processes.
#pragma once

#include <cstdint>

namespace Keelgate::Sandbox {

/// What a zygote begins with.
struct ZygoteStart {
  /// The layers (Layer) that its launcher gave it.
  std::uint32_t layers;
  /// Hangs up when the launcher dies.
  int launcher;
};

/// Forks the zygote into namespaces of its own and returns in it. The calling process becomes its
/// launcher: it ends as the zygote ends, and by SIGTERM with all that it started. Throws
/// StartError, in either process.
ZygoteStart startZygote();

}  // namespace Keelgate::Sandbox
