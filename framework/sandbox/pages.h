// SPDX-License-Identifier: Apache-2.0
/// Page faults, taken before anybody waits.
#pragma once

namespace Keelgate::Sandbox {

/// Has the pages mapped that a message is going to need: a fork starts without its parent's mapping
/// of the program, and with its data to be copied at the first write. Two thirds of a fresh
/// worker's time for a short message went there.
void touchPages() noexcept;

}  // namespace Keelgate::Sandbox
