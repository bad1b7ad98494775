// SPDX-License-Identifier: Apache-2.0
/// Instants in UTC as RFC 3339 spells them: seconds since 2001-01-01T00:00:00Z, years 1 to 9999 of
/// the Gregorian calendar carried back, no leap seconds.
///
/// Pure functions; may be used from any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace Keelgate::Text {

/// Rounded to microseconds, with as many fraction digits as that needs. Nothing for what is not
/// finite or outside the years 1 to 9999. Throws std::bad_alloc.
std::optional<std::string> dateTimeText(double seconds);

/// Reads YYYY-MM-DDTHH:MM:SSZ and nothing else: no fraction, no offset, no white space. Nothing for
/// what is spelt otherwise or is not in the calendar.
std::optional<double> parseDateTime(std::string_view text) noexcept;

}  // namespace Keelgate::Text
