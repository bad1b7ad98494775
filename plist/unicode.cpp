// SPDX-License-Identifier: Apache-2.0
// Character by character where it must be, in blocks where a message is plain.
#include "plist/unicode.h"

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

constexpr bool isSurrogate(char32_t c) noexcept {
  return isIn(c, 0xD800, 0xDFFF);
}

}  // namespace

Character firstCharacter(std::string_view text) noexcept {
  constexpr Character malformed{0, 0};
  const auto lead = static_cast<unsigned char>(text[0]);
  if (lead < 0x80) return {lead, 1};
  if (lead < 0xC2 || lead > 0xF4) return malformed;
  // 0xC0 and 0xC1 could begin overlong forms only, 0xF5 and above what lies beyond U+10FFFF.
  const std::size_t length = lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
  if (text.size() < length) return malformed;
  char32_t codePoint = lead & (0x7Fu >> length);
  for (std::size_t i = 1; i < length; ++i) {
    const auto next = static_cast<unsigned char>(text[i]);
    if ((next & 0xC0u) != 0x80) return malformed;
    codePoint = (codePoint << 6) | (next & 0x3Fu);
  }
  // By length: what could have been written shorter is not well-formed.
  constexpr std::array<char32_t, 5> smallest = {0, 0, 0x80, 0x800, 0x10000};
  if (codePoint < smallest[length] || codePoint > 0x10FFFF || isSurrogate(codePoint)) {
    return malformed;
  }
  return {codePoint, length};
}

// Never asked for a surrogate: both callers have checked.
std::size_t encodeUtf8(char32_t c, char* out) noexcept {
  const auto tail = [c](unsigned shift) {
    return static_cast<char>(0x80 | ((c >> shift) & 0x3F));
  };
  if (c < 0x80) {
    out[0] = static_cast<char>(c);
    return 1;
  }
  if (c < 0x800) {
    out[0] = static_cast<char>(0xC0 | (c >> 6));
    out[1] = tail(0);
    return 2;
  }
  if (c < 0x10000) {
    out[0] = static_cast<char>(0xE0 | (c >> 12));
    out[1] = tail(6);
    out[2] = tail(0);
    return 3;
  }
  out[0] = static_cast<char>(0xF0 | (c >> 18));
  out[1] = tail(12);
  out[2] = tail(6);
  out[3] = tail(0);
  return 4;
}

bool isAscii(Bytes bytes) noexcept {
  constexpr std::size_t block = 64;
  while (bytes.size() >= block) {
    // Blocks without an exit inside become vector code.
    std::byte seen{};
    for (const std::byte c : bytes.first<block>()) seen |= c;
    if ((seen & std::byte{0x80}) != std::byte{}) return false;
    bytes = bytes.subspan(block);
  }
  std::byte seen{};
  for (const std::byte c : bytes) seen |= c;
  return (seen & std::byte{0x80}) == std::byte{};
}

std::size_t utf8FromUtf16(Bytes units, char* out) noexcept {
  const auto unit = [units](std::size_t at) {
    return static_cast<char32_t>((std::to_integer<unsigned>(units[at]) << 8) |
                                 std::to_integer<unsigned>(units[at + 1]));
  };
  std::size_t written = 0;
  for (std::size_t at = 0; at < units.size(); at += 2) {
    char32_t c = unit(at);
    if (isSurrogate(c)) {
      if (c > 0xDBFF || at + 2 >= units.size() || !isIn(unit(at + 2), 0xDC00, 0xDFFF)) {
        return failed;
      }
      at += 2;
      // Ten bits from each half. A pair takes two units and four bytes, so three a unit are enough.
      c = 0x10000 + ((c & 0x3FF) << 10) + (unit(at) & 0x3FF);
    }
    written += encodeUtf8(c, out + written);
  }
  return written;
}

bool isXmlCharacter(char32_t c) noexcept {
  // What XML excludes it excludes as a character reference too.
  if (c < 0x20) return c == '\t' || c == '\n' || c == '\r';
  return c <= 0x10FFFF && !isSurrogate(c) && c != 0xFFFE && c != 0xFFFF;
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
