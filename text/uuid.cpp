// SPDX-License-Identifier: Apache-2.0
#include "text/uuid.h"

#include "text/ascii.h"

#include <cstddef>

namespace Keelgate::Text {

namespace {

constexpr std::string_view form = "00000000-0000-0000-0000-000000000000";

}  // namespace

std::string uuidText(const UuidOctets& octets) {
  std::string text(form);
  std::size_t digits = 0;
  for (char& c : text) {
    if (c == '-') continue;
    const unsigned octet = octets[digits / 2];
    c = "0123456789ABCDEF"[digits % 2 == 0 ? octet >> 4 : octet & 0xf];
    ++digits;
  }
  return text;
}

std::optional<UuidOctets> parseUuid(std::string_view text) noexcept {
  if (text.size() != form.size()) return std::nullopt;
  UuidOctets octets{};
  std::size_t digits = 0;
  for (std::size_t at = 0; at < form.size(); ++at) {
    if (form[at] == '-') {
      if (text[at] != '-') return std::nullopt;
      continue;
    }
    const int digit = hexDigit(text[at]);
    if (digit < 0) return std::nullopt;
    std::uint8_t& octet = octets[digits++ / 2];
    octet = static_cast<std::uint8_t>(octet << 4 | digit);
  }
  return octets;
}

}  // namespace Keelgate::Text
