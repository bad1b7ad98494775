// SPDX-License-Identifier: Apache-2.0
// UTF-16, strictly, and which characters XML admits.
//
// Pure functions; may be used from any thread.
#pragma once

#include <cstddef>
#include <string_view>

#include "plist/bytes.h"

namespace PropertyList {

// Converts big-endian UTF-16 of an even number of bytes to UTF-8. `out` has room for 3 bytes per
// unit. Returns the bytes written, or failed where a surrogate stands alone.
inline constexpr std::size_t failed = static_cast<std::size_t>(-1);
std::size_t utf8FromUtf16(Bytes units, char* out) noexcept;

// What XML 1.0 calls Char, NameStartChar and NameChar. They say what may stand in a document, not
// what is sensible to show.
bool isXmlCharacter(char32_t codePoint) noexcept;
bool isXmlNameStart(char32_t codePoint) noexcept;
bool isXmlNameCharacter(char32_t codePoint) noexcept;

}  // namespace PropertyList
