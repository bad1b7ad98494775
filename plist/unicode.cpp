// SPDX-License-Identifier: Apache-2.0
#include "plist/unicode.h"

#include "text/utf8.h"

#include <algorithm>
#include <array>
#include <cstdint>

namespace PropertyList {
namespace {

struct Range {
  char32_t first;
  char32_t last;
};

// Above ASCII, in order. Twelve are few enough to be tried one by one.
constexpr std::array<Range, 12> nameStartRanges = {{{0xC0, 0xD6},
                                                    {0xD8, 0xF6},
                                                    {0xF8, 0x2FF},
                                                    {0x370, 0x37D},
                                                    {0x37F, 0x1FFF},
                                                    {0x200C, 0x200D},
                                                    {0x2070, 0x218F},
                                                    {0x2C00, 0x2FEF},
                                                    {0x3001, 0xD7FF},
                                                    {0xF900, 0xFDCF},
                                                    {0xFDF0, 0xFFFD},
                                                    {0x10000, 0xEFFFF}}};

constexpr bool isIn(char32_t c, char32_t first, char32_t last) noexcept {
  return c >= first && c <= last;
}

}  // namespace

std::size_t utf8FromUtf16(Bytes units, char* out) noexcept {
  const auto unit = [units](std::size_t at) {
    return static_cast<char32_t>((std::to_integer<unsigned>(units[at]) << 8) |
                                 std::to_integer<unsigned>(units[at + 1]));
  };
  std::size_t written = 0;
  for (std::size_t at = 0; at < units.size(); at += 2) {
    char32_t c = unit(at);
    if (Text::isSurrogate(c)) {
      if (c > 0xDBFF || at + 2 >= units.size() || !isIn(unit(at + 2), 0xDC00, 0xDFFF)) {
        return failed;
      }
      at += 2;
      // Ten bits from each half. A pair takes two units and four bytes, so three a unit are enough.
      c = 0x10000 + ((c & 0x3FF) << 10) + (unit(at) & 0x3FF);
    }
    written += Text::encodeUtf8(c, out + written);
  }
  return written;
}

bool isXmlCharacter(char32_t c) noexcept {
  // What XML excludes it excludes as a character reference too.
  if (c < 0x20) return c == '\t' || c == '\n' || c == '\r';
  return c <= 0x10FFFF && !Text::isSurrogate(c) && c != 0xFFFE && c != 0xFFFF;
}

bool isXmlNameStart(char32_t c) noexcept {
  if (c < 0x80) return isIn(c | 0x20, 'a', 'z') || c == '_' || c == ':';
  return std::ranges::any_of(nameStartRanges,
                             [c](Range range) { return isIn(c, range.first, range.last); });
}

bool isXmlNameCharacter(char32_t c) noexcept {
  return isXmlNameStart(c) || isIn(c, '0', '9') || c == '-' || c == '.' || c == 0xB7 ||
         isIn(c, 0x300, 0x36F) || isIn(c, 0x203F, 0x2040);
}

}  // namespace PropertyList
