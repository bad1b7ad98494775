// SPDX-License-Identifier: Apache-2.0
/// What a harness asks of the code under it.
#pragma once

#include <cstdio>
#include <cstdlib>

namespace Keelgate::Fuzz {

/// Ends the process where it does not hold, as a fuzzer expects of a fault that it is to keep.
inline void require(bool holds, const char* what) {
  if (holds) return;
  std::fprintf(stderr, "a harness asks in vain: %s\n", what);
  std::abort();
}

}  // namespace Keelgate::Fuzz
