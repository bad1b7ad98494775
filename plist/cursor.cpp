// SPDX-License-Identifier: Apache-2.0
// Scanning plain text, where XML messages spend most of their bytes.
#include "plist/cursor.h"

#include <array>

namespace PropertyList {
namespace {

constexpr bool isPlain(unsigned c) noexcept {
  return (c >= 0x20 || c == '\t' || c == '\n') && c < 0x80 && c != '<' && c != '&' && c != ']';
}

constexpr auto plainBytes = [] {
  std::array<bool, 256> table{};
  for (unsigned c = 0; c < table.size(); ++c) table[c] = isPlain(c);
  return table;
}();

// The compilers' portable vectors: one register where the machine has such, words elsewhere.
constexpr std::size_t blockLength = 16;
using Block [[gnu::vector_size(blockLength)]] = signed char;

// How many bytes of a block come before the first that is not plain.
std::size_t plainPrefix(const std::byte* bytes) noexcept {
  Block block;
  std::memcpy(&block, bytes, sizeof block);
  // As signed numbers, the bytes above 0x7F are below a space too.
  const auto special = ((block < ' ') & (block != '\n') & (block != '\t')) | (block == '<') |
                       (block == '&') | (block == ']');
  std::array<std::uint64_t, 2> words;
  static_assert(sizeof words == sizeof special);
  std::memcpy(words.data(), &special, sizeof words);
  constexpr bool isLittle = std::endian::native == std::endian::little;
  const auto before = [](std::uint64_t word) {
    return static_cast<std::size_t>(isLittle ? std::countr_zero(word) : std::countl_zero(word)) / 8;
  };
  return words[0] != 0 ? before(words[0]) : 8 + before(words[1]);
}

}  // namespace

void Cursor::skipPlain() noexcept {
  while (remaining() >= blockLength) {
    const std::size_t length = plainPrefix(here_);
    here_ += length;
    if (length < blockLength) return;
  }
  // The last few bytes of a message, too few for a block.
  while (here_ != end_ && plainBytes[std::to_integer<std::size_t>(*here_)]) ++here_;
}

}  // namespace PropertyList
