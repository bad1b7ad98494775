// SPDX-License-Identifier: Apache-2.0
// Base64: a quick loop for the long middle, a careful one for line ends and padding.
#include <array>
#include <bit>
#include <cstdint>
#include <cstring>

#include "plist/block.h"
#include "plist/cursor.h"
#include "plist/xml_scalars.h"

namespace PropertyList {
namespace {

constexpr std::string_view alphabet =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
// Above the 24 bits of a group, so that one comparison of the combined group finds it.
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

// The first bytes of a group, most significant first.
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

// Decodes as many groups without white space or padding as it can, and returns how many. Each is
// written as 4 bytes, the last of which the next group replaces.
std::size_t decodeGroups(std::string_view text, char* out) noexcept {
  std::size_t groups = 0;
  for (; 4 * groups + 4 <= text.size(); ++groups) {
    const auto c = Cursor::wordAt<std::array<char, 4>>(text, 4 * groups);
    std::uint32_t bits = lookUp(0, c[0]) | lookUp(1, c[1]) | lookUp(2, c[2]) | lookUp(3, c[3]);
    if (bits >= notInAlphabet) break;
    bits <<= 8;
    if constexpr (std::endian::native == std::endian::little) bits = __builtin_bswap32(bits);
    std::memcpy(out + 3 * groups, &bits, sizeof bits);
  }
  return groups;
}

using Groups [[gnu::vector_size(blockLength)]] = std::uint32_t;

// The same for four groups at a time, on a machine whose words begin with the least byte. Each two
// are written as 8 bytes, the last two of which what follows replaces.
std::size_t decodeBlocks(std::string_view text, char* out) noexcept {
  if constexpr (std::endian::native != std::endian::little) return 0;
  std::size_t groups = 0;
  for (; 4 * groups + blockLength <= text.size(); groups += 4) {
    const auto c = Cursor::wordAt<Block>(text, 4 * groups);
    const Block folded = c | ' ';
    const Block isLetter = (folded > '`') & (folded < '{');
    const Block isSmall = c > '`';
    const Block isDigit = (c > '/') & (c < ':');
    const Block isPlus = c == '+';
    const Block isSlash = c == '/';
    if (unmarkedPrefix(~(isLetter | isDigit | isPlus | isSlash)) < blockLength) break;
    const Block bits = c - (isLetter & 'A') - (isSmall & ('a' - 'Z' - 1)) + (isDigit & (52 - '0')) +
                       (isPlus & (62 - '+')) + (isSlash & (63 - '/'));
    const auto six = std::bit_cast<Groups>(bits);
    const Groups twelve = (six & 0x00FF'00FF) << 6 | (six >> 8 & 0x00FF'00FF);
    const Groups all = (twelve << 12 | twelve >> 16) & 0x00FF'FFFF;
    const auto pairs = std::bit_cast<std::array<std::uint64_t, 2>>(all);
    for (std::size_t i = 0; i < pairs.size(); ++i) {
      const std::uint64_t bytes = __builtin_bswap64(pairs[i] << 40 | pairs[i] >> 16);
      std::memcpy(out + 3 * groups + 6 * i, &bytes, sizeof bytes);
    }
  }
  return groups;
}

}  // namespace

Base64Run decodeBase64Run(std::string_view text, char* out) noexcept {
  Base64Run run{0, 0};
  const auto count = [&run](std::size_t groups) {
    run.read += 4 * groups;
    run.written += 3 * groups;
  };
  // Once per line.
  do {
    while (run.read < text.size() && isSpace(text[run.read])) ++run.read;
    count(decodeBlocks(text.substr(run.read), out + run.written));
    count(decodeGroups(text.substr(run.read), out + run.written));
  } while (run.read < text.size() && isSpace(text[run.read]));
  return run;
}

// Deliberate: spare bits before the padding may be set, as in "QR==". Nothing here signs or
// compares encoded text, and writers that leave them set exist.
std::optional<std::size_t> decodeBase64(std::string_view text, char* out) noexcept {
  std::size_t written = 0;
  bool ended = false;
  for (;;) {
    if (!ended) {
      const Base64Run run = decodeBase64Run(text, out + written);
      text.remove_prefix(run.read);
      written += run.written;
    }
    Group group;
    while (!text.empty() && group.characters < 4) {
      if (!group.add(text.front())) return std::nullopt;
      text.remove_prefix(1);
    }
    if (group.characters == 0) return written;
    if (group.characters < 4 || ended) return std::nullopt;
    write(group.bits, 3 - group.padding, out + written);
    written += 3 - group.padding;
    ended = group.padding > 0;
  }
}

}  // namespace PropertyList
