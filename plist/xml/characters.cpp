// SPDX-License-Identifier: Apache-2.0
#include "plist/xml/characters.h"

#include "text/utf8.h"

#include <algorithm>
#include <array>

namespace PropertyList {
namespace {

struct Range {
  char32_t first;
  char32_t last;
};

/// Above ASCII, in order. Twelve are few enough to be tried one by one.
constexpr std::array<Range, 12> nameStartRanges = {{{0xc0, 0xd6},
                                                    {0xd8, 0xf6},
                                                    {0xf8, 0x2ff},
                                                    {0x370, 0x37d},
                                                    {0x37f, 0x1fff},
                                                    {0x200c, 0x200d},
                                                    {0x2070, 0x218f},
                                                    {0x2c00, 0x2fef},
                                                    {0x3001, 0xd7ff},
                                                    {0xf900, 0xfdcf},
                                                    {0xfdf0, 0xfffd},
                                                    {0x10000, 0xeffff}}};

constexpr bool isIn(char32_t c, char32_t first, char32_t last) noexcept {
  return c >= first && c <= last;
}

}  // namespace

bool isXmlCharacter(char32_t c) noexcept {
  // What XML excludes it excludes as a character reference too.
  if (c < 0x20) return c == '\t' || c == '\n' || c == '\r';
  return c <= 0x10ffff && !Keelgate::Text::isSurrogate(c) && c != 0xfffe && c != 0xffff;
}

bool isXmlNameStart(char32_t c) noexcept {
  if (c < 0x80) return isIn(c | 0x20, 'a', 'z') || c == '_' || c == ':';
  return std::ranges::any_of(nameStartRanges,
                             [c](Range range) { return isIn(c, range.first, range.last); });
}

bool isXmlNameCharacter(char32_t c) noexcept {
  return isXmlNameStart(c) || isIn(c, '0', '9') || c == '-' || c == '.' || c == 0xb7 ||
         isIn(c, 0x300, 0x36f) || isIn(c, 0x203f, 0x2040);
}

}  // namespace PropertyList
