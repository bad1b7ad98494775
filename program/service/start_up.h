// SPDX-License-Identifier: Apache-2.0
/// The entry, apart from main() so that a test can call it. For the main thread, once.
#pragma once

namespace VespKeelgateService {

/// The whole life of the service's process: prepares it, registers the unpackers and hands it over
/// to the server. Returns the exit status, if the server ever lets go of it.
int startUp();

}  // namespace VespKeelgateService
