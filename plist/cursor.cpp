// SPDX-License-Identifier: Apache-2.0
#include "plist/cursor.h"

#include <array>

namespace PropertyList {
namespace {

constexpr bool isSpace(std::byte c) noexcept {
  return c == std::byte{' '} || c == std::byte{'\n'} || c == std::byte{'\t'} ||
         c == std::byte{'\r'};
}

constexpr bool isPlain(unsigned c) noexcept {
  return (c >= 0x20 || c == '\t' || c == '\n') && c < 0x80 && c != '<' && c != '&' && c != ']';
}

constexpr auto plainBytes = [] {
  std::array<bool, 256> table{};
  for (unsigned c = 0; c < table.size(); ++c) table[c] = isPlain(c);
  return table;
}();

constexpr std::size_t blockLength = 32;

// No early exit and no table, so that the compiler turns the loop into vector comparisons.
bool isPlainBlock(const std::byte* block) noexcept {
  unsigned char special = 0;
  for (std::size_t i = 0; i < blockLength; ++i) {
    const auto c = static_cast<unsigned char>(block[i]);
    special |= static_cast<unsigned char>(c >= 0x80) |
               static_cast<unsigned char>((c < 0x20) & (c != '\n') & (c != '\t')) |
               static_cast<unsigned char>(c == '<') | static_cast<unsigned char>(c == '&') |
               static_cast<unsigned char>(c == ']');
  }
  return special == 0;
}

}  // namespace

bool Cursor::skipSpace() noexcept {
  const std::byte* const start = here_;
  while (here_ != end_ && isSpace(*here_)) ++here_;
  return here_ != start;
}

void Cursor::skipPlain() noexcept {
  while (remaining() >= blockLength && isPlainBlock(here_)) here_ += blockLength;
  while (here_ != end_ && plainBytes[std::to_integer<std::size_t>(*here_)]) ++here_;
}

}  // namespace PropertyList
