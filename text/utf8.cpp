// SPDX-License-Identifier: Apache-2.0
#include "text/utf8.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>

namespace Keelgate::Text {

namespace {

/// How many bytes of ASCII the text begins with, give or take: blocks without an exit inside become
/// vector code, so it stops before the block that holds the first other byte.
std::size_t asciiBlocks(std::string_view text) noexcept {
  constexpr std::size_t block = 64;
  std::size_t length = 0;
  for (; text.size() - length >= block; length += block) {
    // By address: a check of each index would keep the loop from becoming vector code.
    const char* const bytes = text.data() + length;
    unsigned char seen = 0;
    for (std::size_t i = 0; i < block; ++i) {
      seen = static_cast<unsigned char>(seen | static_cast<unsigned char>(bytes[i]));
    }
    if (seen >= 0x80) break;
  }
  return length;
}

}  // namespace

Character firstCharacter(std::string_view text) noexcept {
  constexpr Character malformed{0, 0};
  const auto lead = static_cast<unsigned char>(text[0]);
  if (lead < 0x80) return {lead, 1};
  // 0xc0 and 0xc1 could begin overlong forms only, 0xf5 and above what lies beyond U+10FFFF.
  if (lead < 0xc2 || lead > 0xf4) return malformed;
  const std::size_t length = lead < 0xe0 ? 2 : lead < 0xf0 ? 3 : 4;
  if (text.size() < length) return malformed;
  char32_t codePoint = lead & (0x7fU >> length);
  for (std::size_t i = 1; i < length; ++i) {
    const auto next = static_cast<unsigned char>(text[i]);
    if ((next & 0xc0U) != 0x80) return malformed;
    codePoint = (codePoint << 6) | (next & 0x3fU);
  }
  // By length: what could have been written shorter is not well-formed.
  constexpr std::array<char32_t, 5> smallest = {0, 0, 0x80, 0x800, 0x10000};
  if (codePoint < smallest[length] || codePoint > 0x10ffff || isSurrogate(codePoint)) {
    return malformed;
  }
  return {codePoint, length};
}

bool isUtf8(std::string_view text) noexcept {
  // As most texts are, by words and not by characters.
  if (text.size() < 64 && isAscii(text)) return true;
  while (!text.empty()) {
    const std::size_t ascii = asciiBlocks(text);
    text.remove_prefix(ascii);
    // To the end of the block: what comes after it may be ASCII again.
    for (const std::size_t end = text.size() < 64 ? 0 : text.size() - 64; text.size() > end;) {
      const Character next = firstCharacter(text);
      if (next.length == 0) return false;
      text.remove_prefix(next.length);
    }
  }
  return true;
}

bool isAscii(std::string_view text) noexcept {
  if (text.size() >= 64) text.remove_prefix(asciiBlocks(text));
  std::uint64_t seen = 0;
  const auto look = [&]<class Word>(std::size_t at, Word word) {
    std::memcpy(&word, text.data() + at, sizeof word);
    seen |= word;
  };
  // In both cases words overlap.
  if (text.size() >= 8) {
    std::size_t at = 0;
    for (; text.size() - at > 32; at += 8) look(at, std::uint64_t());
    // Four words that overlap as they must: a loop's end could not be foreseen.
    const std::size_t rest = text.size() - at;
    look(at, std::uint64_t());
    look(at + std::min<std::size_t>(8, rest - 8), std::uint64_t());
    look(at + (rest > 16 ? rest - 16 : 0), std::uint64_t());
    look(text.size() - 8, std::uint64_t());
  } else if (text.size() >= 4) {
    look(0, std::uint32_t());
    look(text.size() - 4, std::uint32_t());
  } else {
    for (const char c : text) seen |= static_cast<unsigned char>(c);
  }
  return (seen & 0x8080'8080'8080'8080) == 0;
}

std::size_t encodeUtf8(char32_t c, char* out) noexcept {
  const auto tail = [c](unsigned shift) {
    return static_cast<char>(0x80 | ((c >> shift) & 0x3f));
  };
  if (c < 0x80) {
    out[0] = static_cast<char>(c);
    return 1;
  }
  if (c < 0x800) {
    out[0] = static_cast<char>(0xc0 | (c >> 6));
    out[1] = tail(0);
    return 2;
  }
  if (c < 0x10000) {
    out[0] = static_cast<char>(0xe0 | (c >> 12));
    out[1] = tail(6);
    out[2] = tail(0);
    return 3;
  }
  out[0] = static_cast<char>(0xf0 | (c >> 18));
  out[1] = tail(12);
  out[2] = tail(6);
  out[3] = tail(0);
  return 4;
}

}  // namespace Keelgate::Text
