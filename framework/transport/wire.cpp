// SPDX-License-Identifier: Apache-2.0
/// UTF-8, as strictly as it can be read. The host has its own check, apart from that of the
/// program: it must not rely on anything that a taken-over worker did.
#include "framework/transport/wire.h"

namespace Keelgate::Transport {

namespace {

constexpr bool isContinuation(unsigned char c) {
  return (c & 0xc0) == 0x80;
}

/// How many bytes the character at `at` takes; 0 if there is none.
std::size_t characterLength(const unsigned char* at, std::size_t rest) noexcept {
  const unsigned char lead = at[0];
  if (lead < 0x80) return 1;
  // 0xc0 and 0xc1 begin overlong forms alone, 0xf5 and above what lies beyond U+10FFFF.
  if (lead < 0xc2 || lead > 0xf4) return 0;
  const std::size_t length = lead < 0xe0 ? 2 : lead < 0xf0 ? 3 : 4;
  if (rest < length) return 0;
  for (std::size_t i = 1; i < length; ++i) {
    if (!isContinuation(at[i])) return 0;
  }
  // The second byte also tells overlong forms, surrogates and what lies beyond U+10FFFF.
  if (lead == 0xe0 && at[1] < 0xa0) return 0;
  if (lead == 0xed && at[1] > 0x9f) return 0;
  if (lead == 0xf0 && at[1] < 0x90) return 0;
  if (lead == 0xf4 && at[1] > 0x8f) return 0;
  return length;
}

}  // namespace

bool isUtf8(std::string_view text) noexcept {
  const auto* at = reinterpret_cast<const unsigned char*>(text.data());
  std::size_t rest = text.size();
  while (rest > 0) {
    const std::size_t length = characterLength(at, rest);
    if (length == 0) return false;
    at += length;
    rest -= length;
  }
  return true;
}

std::string_view Reader::text() {
  const Bytes bytes = octets();
  const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  if (!isUtf8(text)) throw MalformedReply();
  return text;
}

}  // namespace Keelgate::Transport
