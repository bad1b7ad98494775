// SPDX-License-Identifier: Apache-2.0
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

/// Sixteen bytes in the compilers' portable vectors: one register where the machine has such.
/// Signed, because that is what machines compare: the bytes above 0x7f are below zero.
using Block [[gnu::vector_size(16)]] = signed char;

/// How many bytes come before the first that is marked; 16 if none is.
std::size_t unmarkedPrefix(Block marks) noexcept {
  constexpr bool isLittle = std::endian::native == std::endian::little;
  const auto before = [](std::uint64_t word) {
    return static_cast<std::size_t>(isLittle ? std::countr_zero(word) : std::countl_zero(word)) / 8;
  };
  const auto words = std::bit_cast<std::array<std::uint64_t, 2>>(marks);
  return words[0] != 0 ? before(words[0]) : 8 + before(words[1]);
}

}  // namespace

void Cursor::skipPlain() noexcept {
  while (remaining() >= sizeof(Block)) {
    Block block;
    std::memcpy(&block, here_, sizeof block);
    // Bytes above 0x7f are below a space too.
    const std::size_t plain = unmarkedPrefix(((block < ' ') & (block != '\n') & (block != '\t')) |
                                             (block == '<') | (block == '&') | (block == ']'));
    here_ += plain;
    if (plain < sizeof block) return;
  }
  while (here_ != end_ && plainBytes[std::to_integer<std::size_t>(*here_)]) ++here_;
}

}  // namespace PropertyList
