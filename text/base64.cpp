// SPDX-License-Identifier: Apache-2.0
#include "text/base64.h"

#include "text/ascii.h"

#include <array>
#include <bit>
#include <cstdint>
#include <cstring>

namespace Keelgate::Text {

namespace {

constexpr std::string_view alphabet =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
/// Above the 24 bits of a group, so that one comparison of the combined group finds it.
constexpr std::uint32_t notInAlphabet = 0x0100'0000;

using Table = std::array<std::uint32_t, 256>;

/// A character's six bits at their place in a group of four, or a bit that no group can have.
constexpr Table tableFor(unsigned shift) {
  Table table{};
  table.fill(notInAlphabet);
  for (std::uint32_t bits = 0; bits < alphabet.size(); ++bits) {
    table[static_cast<unsigned char>(alphabet[bits])] = bits << shift;
  }
  return table;
}

constexpr std::array<Table, 4> tables = {tableFor(18), tableFor(12), tableFor(6), tableFor(0)};

/// What 12 bits become, for each of their values.
constexpr auto pairs = [] {
  std::array<std::array<char, 2>, 4096> all{};
  for (std::size_t bits = 0; bits < all.size(); ++bits) {
    all[bits] = {alphabet[bits >> 6], alphabet[bits & 63]};
  }
  return all;
}();

constexpr std::uint32_t lookUp(std::size_t place, char c) noexcept {
  return tables[place].data()[static_cast<unsigned char>(c)];
}

/// Decodes as many groups without white space or padding as the text begins with, and returns how
/// many. Each is written as 4 bytes, the last of which the next group replaces.
std::size_t decodeGroups(std::string_view text, char* out) noexcept {
  std::size_t groups = 0;
  for (; 4 * groups + 4 <= text.size(); ++groups) {
    const char* const c = text.data() + 4 * groups;
    std::uint32_t bits = lookUp(0, c[0]) | lookUp(1, c[1]) | lookUp(2, c[2]) | lookUp(3, c[3]);
    if (bits >= notInAlphabet) break;
    bits <<= 8;
    if constexpr (std::endian::native == std::endian::little) bits = __builtin_bswap32(bits);
    std::memcpy(out + 3 * groups, &bits, sizeof bits);
  }
  return groups;
}

/// Four characters that may have white space among them and padding at their end.
struct Group {
  std::uint32_t bits = 0;
  std::size_t characters = 0;
  std::size_t padding = 0;

  bool add(char c) noexcept {
    if (c == '=') {
      ++padding;
      return characters++ >= 2;
    }
    const std::uint32_t six = padding > 0 ? notInAlphabet : lookUp(characters, c);
    bits |= six;
    ++characters;
    return six != notInAlphabet;
  }
  std::size_t length() const noexcept { return 3 - padding; }
  /// Whether a bit is set that belongs to no byte.
  bool hasSpareBits() const noexcept { return (bits & ((1U << 8 * padding) - 1)) != 0; }
};

}  // namespace

void encodeBase64(std::span<const std::byte> bytes, char* out) noexcept {
  // By address: a check of each index takes as long as the rest.
  const std::byte* in = bytes.data();
  const std::byte* const end = in + bytes.size();
  const auto octet = [&](std::size_t i) {
    return std::to_integer<std::uint32_t>(in[i]);
  };
  const auto putPair = [](std::uint64_t bits, char* to) {
    std::memcpy(to, pairs.data() + (bits & 0xfff), 2);
  };
  // Six bytes of eight that are read at once.
  for (; end - in >= 8; in += 6, out += 8) {
    std::uint64_t word;
    std::memcpy(&word, in, sizeof word);
    if constexpr (std::endian::native == std::endian::little) word = __builtin_bswap64(word);
    for (unsigned pair = 0; pair < 4; ++pair) putPair(word >> (52 - 12 * pair), out + 2 * pair);
  }
  for (; end - in >= 3; in += 3, out += 4) {
    const std::uint32_t group = octet(0) << 16 | octet(1) << 8 | octet(2);
    putPair(group >> 12, out);
    putPair(group, out + 2);
  }
  const std::size_t rest = bytes.size() % 3;
  if (rest == 0) return;
  const std::uint32_t group = octet(0) << 16 | (rest == 2 ? octet(1) << 8 : 0);
  putPair(group >> 12, out);
  out[2] = rest == 2 ? alphabet[group >> 6 & 63] : '=';
  out[3] = '=';
}

std::string encodeBase64(std::span<const std::byte> bytes) {
  std::string text(base64Length(bytes.size()), '\0');
  encodeBase64(bytes, text.data());
  return text;
}

std::optional<std::size_t> decodeBase64(std::string_view text, char* out, Base64 form) noexcept {
  const bool isSpaced = form == Base64::spaced;
  std::size_t written = 0;
  const auto skipSpace = [&] {
    while (isSpaced && !text.empty() && isSpace(text.front())) text.remove_prefix(1);
  };
  for (bool ended = false;;) {
    skipSpace();
    if (!ended) {
      const std::size_t groups = decodeGroups(text, out + written);
      text.remove_prefix(4 * groups);
      written += 3 * groups;
      // The end of a line, as a rule: what follows is quick again.
      if (groups > 0) skipSpace();
      if (groups > 0 && text.size() >= 4) continue;
    }
    Group group;
    for (; !text.empty() && group.characters < 4; skipSpace()) {
      if (!group.add(text.front())) return std::nullopt;
      text.remove_prefix(1);
    }
    if (group.characters == 0) return written;
    if (group.characters < 4 || ended || (!isSpaced && group.hasSpareBits())) return std::nullopt;
    for (std::size_t i = 0; i < group.length(); ++i) {
      out[written++] = static_cast<char>(group.bits >> (16 - 8 * i));
    }
    ended = group.padding > 0;
  }
}

}  // namespace Keelgate::Text
