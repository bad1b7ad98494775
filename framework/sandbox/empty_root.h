// SPDX-License-Identifier: Apache-2.0
/// The root directory: no file to read, execute or fill, even for one who gets past the filter.
#pragma once

namespace Keelgate::Sandbox {

/// Puts the process, which must be in a mount namespace of its own, on an empty read-only root and
/// lets go of the old one. False when the machine does not let it; nothing was lost then.
/// Single-threaded callers only.
bool enterEmptyRoot();

}  // namespace Keelgate::Sandbox
