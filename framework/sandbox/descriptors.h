// SPDX-License-Identifier: Apache-2.0
/// Descriptors: a worker has exactly one, so that there is nothing else to read from or write to.
///
/// For single-threaded processes: another thread could open what was just closed.
#pragma once

namespace Keelgate::Sandbox {

/// Closes every descriptor of the process but `kept`, and makes it the service's descriptor; all of
/// them where that is -1.
/// Throws StartError when it cannot.
void keepOnly(int kept);

}  // namespace Keelgate::Sandbox
