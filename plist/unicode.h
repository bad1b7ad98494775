// SPDX-License-Identifier: Apache-2.0
// Characters: UTF-8 and UTF-16, strictly, and which characters XML admits.
//
// Pure functions; may be used from any thread.
#pragma once

#include <cstddef>
#include <string_view>

#include "plist/bytes.h"

namespace PropertyList {

// With its length, because the number alone does not tell how it was spelt.
struct Character {
  char32_t codePoint;
  std::size_t length;  // in UTF-8 bytes; 0 where the text is not well-formed
};

// The first character of a text that is not empty. Overlong forms, surrogates and numbers above
// U+10FFFF are not well-formed: two spellings of one key must not slip past a comparison.
Character firstCharacter(std::string_view text) noexcept;

// Writes a character, no surrogate, as 1 to 4 bytes of UTF-8; returns how many.
std::size_t encodeUtf8(char32_t codePoint, char* out) noexcept;

// Whether no byte is above 0x7F. Control characters and zero are ASCII.
bool isAscii(Bytes bytes) noexcept;

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
