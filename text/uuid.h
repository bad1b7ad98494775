// SPDX-License-Identifier: Apache-2.0
/// UUIDs as text: 8-4-4-4-12 hexadecimal digits.
///
/// Pure functions; may be used from any thread.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace Keelgate::Text {

using UuidOctets = std::array<std::uint8_t, 16>;

/// In upper case. Throws std::bad_alloc.
std::string uuidText(const UuidOctets& octets);

/// Digits in either case. No braces, no prefix, no white space.
std::optional<UuidOctets> parseUuid(std::string_view text) noexcept;

}  // namespace Keelgate::Text
