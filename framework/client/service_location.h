// SPDX-License-Identifier: Apache-2.0
/// Where the service is, and whether its file may be executed.
///
/// The service runs with the caller's rights until it has sealed itself, so whoever can put a file
/// in its place has these rights. The file and every folder on the way to it, symbolic links
/// included, must belong to root or to the caller and be writable by nobody else. A sticky folder,
/// as /tmp is one, is fine for what is in it: there others can neither rename nor remove it.
#pragma once

#include "framework/client/descriptor.h"

#include <keelgate/values.h>

namespace Keelgate {

/// A program that may be executed.
struct TrustedProgram {
  /// Opened with O_PATH. It is the file that was looked at, whatever stands at the path since.
  Descriptor file;
  /// For sentences, and for the program's own name.
  String path;
};

/// The program at `path`; where that is empty the VespKeelgateService that belongs to the library
/// or program that this code is in: in a build tree the one of the build, elsewhere the one of the
/// installed tree, wherever it stands now, or else at the place that the build was configured for.
/// Throws StartFailure, with a sentence that says which folder is in whose hands. Callable from any
/// thread.
TrustedProgram locateService(const String& path, DescriptorRegistry& registry);

}  // namespace Keelgate
