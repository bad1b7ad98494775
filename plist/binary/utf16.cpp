// SPDX-License-Identifier: Apache-2.0
#include "plist/binary/utf16.h"

#include "text/utf8.h"

namespace PropertyList {

std::optional<std::size_t> utf8FromUtf16(Bytes units, char* out) noexcept {
  const auto unit = [units](std::size_t at) {
    return static_cast<char32_t>((std::to_integer<unsigned>(units[at]) << 8) |
                                 std::to_integer<unsigned>(units[at + 1]));
  };
  std::size_t written = 0;
  for (std::size_t at = 0; at < units.size(); at += 2) {
    char32_t c = unit(at);
    if (Text::isSurrogate(c)) {
      at += 2;
      const char32_t low = at < units.size() ? unit(at) : 0;
      if (c > 0xdbff || low < 0xdc00 || low > 0xdfff) return std::nullopt;
      // Ten bits from each half. A pair takes two units and four bytes, so three a unit are enough.
      c = 0x10000 + ((c & 0x3ff) << 10) + (low & 0x3ff);
    }
    written += Text::encodeUtf8(c, out + written);
  }
  return written;
}

}  // namespace PropertyList
