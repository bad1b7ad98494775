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

}  // namespace

void Cursor::skipLongPlain() noexcept {
  while (remaining() >= sizeof(Block)) {
    const std::size_t plain = plainPrefix();
    here_ += plain;
    if (plain < sizeof(Block)) return;
  }
  while (here_ != end_ && plainBytes[std::to_integer<std::size_t>(*here_)]) ++here_;
}

}  // namespace PropertyList
