// SPDX-License-Identifier: Apache-2.0
#include <array>
#include <cstdint>

#include "plist/xml_scalars.h"

namespace PropertyList {
namespace {

constexpr std::string_view alphabet =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr std::uint32_t notInAlphabet = 0x0100'0000;

using Table = std::array<std::uint32_t, 256>;

// A character's six bits at their place in a group of four, or a bit that no group can have.
constexpr Table tableFor(unsigned shift) {
  Table table{};
  table.fill(notInAlphabet);
  for (std::uint32_t bits = 0; bits < alphabet.size(); ++bits) {
    table[static_cast<unsigned char>(alphabet[bits])] = bits << shift;
  }
  return table;
}

constexpr std::array<Table, 4> tables = {tableFor(18), tableFor(12), tableFor(6), tableFor(0)};

constexpr std::uint32_t lookUp(std::size_t place, char c) noexcept {
  return tables[place][static_cast<unsigned char>(c)];
}

constexpr bool isSpace(char c) noexcept {
  return c == ' ' || c == '\n' || c == '\t' || c == '\r';
}

void write(std::uint32_t group, std::size_t length, char* out) noexcept {
  for (std::size_t i = 0; i < length; ++i) out[i] = static_cast<char>(group >> (16 - 8 * i));
}

// Four characters that may have white space among them and padding at their end.
struct Group {
  std::uint32_t bits = 0;
  std::size_t characters = 0;
  std::size_t padding = 0;

  bool add(char c) noexcept {
    if (isSpace(c)) return true;
    if (c == '=') {
      ++padding;
      return characters >= 2 && characters++ < 4;
    }
    const std::uint32_t six = padding > 0 ? notInAlphabet : lookUp(characters, c);
    bits |= six;
    ++characters;
    return six != notInAlphabet;
  }
};

// Decodes whole groups without white space; moves `at` to the first group that is none.
std::size_t decodeRun(std::string_view text, std::size_t& at, char* out) noexcept {
  std::size_t written = 0;
  for (; text.size() - at >= 4; at += 4, written += 3) {
    const std::uint32_t group = lookUp(0, text[at]) | lookUp(1, text[at + 1]) |
                                lookUp(2, text[at + 2]) | lookUp(3, text[at + 3]);
    if (group >= notInAlphabet) break;
    write(group, 3, out + written);
  }
  return written;
}

}  // namespace

std::optional<std::size_t> decodeBase64(std::string_view text, char* out) noexcept {
  std::size_t at = 0;
  std::size_t written = 0;
  bool ended = false;
  for (;;) {
    if (!ended) written += decodeRun(text, at, out + written);
    Group group;
    while (at < text.size() && group.characters < 4) {
      if (!group.add(text[at++])) return std::nullopt;
    }
    if (group.characters == 0) return written;
    if (group.characters < 4 || ended) return std::nullopt;
    write(group.bits, 3 - group.padding, out + written);
    written += 3 - group.padding;
    ended = group.padding > 0;
  }
}

}  // namespace PropertyList
