// SPDX-License-Identifier: Apache-2.0
#pragma once

namespace VespKeelgateService {

/// The whole life of the service's process: prepares it, registers the unpackers and hands it over
/// to the server. Returns the exit status, if the server ever lets go of it.
int startUp();

}  // namespace VespKeelgateService
