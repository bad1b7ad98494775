// SPDX-License-Identifier: Apache-2.0
/// UTF-8, strictly: overlong forms, surrogates and numbers above U+10FFFF are not well-formed,
/// since two spellings of one text must not slip past a comparison.
///
/// Pure functions; may be used from any thread.
#pragma once

#include <cstddef>
#include <string_view>

namespace Keelgate::Text {

/// With its length, because the number alone does not tell how it was spelt.
struct Character {
  char32_t codePoint;
  std::size_t length;  // bytes; 0 where the text is not well-formed
};

/// The first character of a text that is not empty.
Character firstCharacter(std::string_view text) noexcept;

/// Whether all of the text is well-formed.
bool isUtf8(std::string_view text) noexcept;

/// Whether no byte is above 0x7f. Control characters and zero are ASCII.
bool isAscii(std::string_view text) noexcept;

constexpr bool isSurrogate(char32_t c) noexcept {
  return c >= 0xd800 && c <= 0xdfff;
}

/// Writes a character that is not a surrogate as 1 to 4 bytes; returns how many.
std::size_t encodeUtf8(char32_t codePoint, char* out) noexcept;

}  // namespace Keelgate::Text
