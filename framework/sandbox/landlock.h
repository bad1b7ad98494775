// SPDX-License-Identifier: Apache-2.0
/// Landlock: the second lock on files, ports, abstract sockets and signals. Unlike namespaces it
/// needs no privilege, so that it stands where a container forbids them.
#pragma once

namespace Keelgate::Sandbox {

/// Gives up every right that the running kernel's Landlock knows, for this process and all that it
/// forks; no_new_privs must be set. With a directory all but to read and write the files in it.
/// False where there is no Landlock or it refuses.
bool renounceByLandlock(int butFor = -1);

}  // namespace Keelgate::Sandbox
