// SPDX-License-Identifier: Apache-2.0
/// Landlock: the second lock on files, ports, abstract sockets and signals. Unlike namespaces it
/// needs no privilege, so that it stands where a container forbids them.
#pragma once

#include <cstdint>

namespace Keelgate::Sandbox {

/// Gives up every right that the running kernel's Landlock knows, for this process and all that it
/// forks; no_new_privs must be set. Returns the kernel's interface number, or 0 where there is no
/// Landlock or it refuses.
std::uint32_t renounceByLandlock();

}  // namespace Keelgate::Sandbox
