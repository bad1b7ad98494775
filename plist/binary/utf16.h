// SPDX-License-Identifier: Apache-2.0
/// The text of binary property lists that is not ASCII.
///
/// A pure function; may be used from any thread.
#pragma once

#include "plist/bytes.h"

#include <cstddef>
#include <optional>

namespace PropertyList {

/// Converts big-endian UTF-16 of an even number of bytes to UTF-8. `out` has room for 3 bytes per
/// unit. Returns the bytes written, or nothing where a surrogate stands alone.
std::optional<std::size_t> utf8FromUtf16(Bytes units, char* out) noexcept;

}  // namespace PropertyList
