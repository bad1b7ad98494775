// SPDX-License-Identifier: Apache-2.0
// The rare ends of the scan for plain text: long texts, and the last few bytes of a message.
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
  while (remaining() >= blockLength) {
    const std::size_t length = plainPrefix();
    here_ += length;
    if (length < blockLength) return;
  }
  while (here_ != end_ && plainBytes[std::to_integer<std::size_t>(*here_)]) ++here_;
}

}  // namespace PropertyList
