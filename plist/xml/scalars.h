// SPDX-License-Identifier: Apache-2.0
/// How XML property lists spell numbers and dates. No locale has a say in any of it.
///
/// Pure functions; may be used from any thread. Each gives nothing for a misspelt text; white space
/// around it is allowed.
#pragma once

#include "plist/document.h"

#include <optional>
#include <string_view>

namespace PropertyList {

/// [+-]?digits, or 0x and 1 to 16 hexadecimal digits; from -2^63 to 2^64 - 1.
std::optional<Integer> parseInteger(std::string_view text) noexcept;

/// Decimal or exponent form, nan, inf or infinity, with or without a sign, in any case. What a
/// double cannot hold is refused: too large, and also a number that only rounding would make zero.
std::optional<double> parseReal(std::string_view text) noexcept;

/// YYYY-MM-DDTHH:MM:SSZ, in seconds since 2001-01-01T00:00:00Z.
std::optional<double> parseDate(std::string_view text) noexcept;

}  // namespace PropertyList
