// SPDX-License-Identifier: Apache-2.0
// Spellings are checked here in full; from_chars only converts what has been found sound.
#include "plist/xml_scalars.h"

#include <algorithm>
#include <charconv>
#include <limits>

#include "plist/cursor.h"

namespace PropertyList {
namespace {

constexpr bool isDigit(char c) noexcept {
  return c >= '0' && c <= '9';
}

constexpr char lower(char c) noexcept {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c | 0x20) : c;
}

// Letters of ASCII alone: in some locales I is not the capital of i.
bool isWord(std::string_view text, std::string_view word) noexcept {
  return std::ranges::equal(text, word, {}, lower);
}

std::string_view trimmed(std::string_view text) noexcept {
  while (!text.empty() && isSpace(text.front())) text.remove_prefix(1);
  while (!text.empty() && isSpace(text.back())) text.remove_suffix(1);
  return text;
}

// The text without its sign, if it has one.
std::string_view unsignedPart(std::string_view text) noexcept {
  const bool isSigned = text.starts_with('+') || text.starts_with('-');
  return isSigned ? text.substr(1) : text;
}

// All of the text as decimal digits, so few that they cannot overflow; or nothing, and another may
// make sense of it.
std::optional<std::uint64_t> parseFewDigits(std::string_view text) noexcept {
  if (text.empty() || text.size() > std::numeric_limits<std::uint64_t>::digits10) {
    return std::nullopt;
  }
  std::uint64_t number = 0;
  for (const char c : text) {
    if (!isDigit(c)) return std::nullopt;
    number = 10 * number + static_cast<std::uint64_t>(c - '0');
  }
  return number;
}

// All of the text as digits to a base; from_chars has a sign of its own, so that is ruled out.
std::optional<std::uint64_t> parseDigits(std::string_view text, int base) noexcept {
  std::uint64_t number = 0;
  const char* const end = text.data() + text.size();
  const auto [stop, error] = std::from_chars(text.data(), end, number, base);
  if (text.empty() || error != std::errc{} || stop != end) return std::nullopt;
  return number;
}

// Digits with a point, at least one digit altogether; then perhaps an exponent.
bool isDecimal(std::string_view text) noexcept {
  const auto digits = [&text] {
    const auto length = static_cast<std::size_t>(
        std::find_if_not(text.begin(), text.end(), isDigit) - text.begin());
    text.remove_prefix(length);
    return length;
  };
  // Counted on both sides of the point: a point by itself is no number.
  std::size_t mantissa = digits();
  if (text.starts_with('.')) {
    text.remove_prefix(1);
    mantissa += digits();
  }
  if (mantissa == 0) return false;
  if (text.empty()) return true;
  if (lower(text[0]) != 'e') return false;
  text = unsignedPart(text.substr(1));
  return digits() > 0 && text.empty();
}

// Days from 2001-01-01 in the Gregorian calendar, for years from 1.
constexpr int daysSince2001(int year, int month, int day) noexcept {
  constexpr int beforeMonth[] = {0, 31, 59, 90, 120, 151, 181, 212, 243, 273, 304, 334};
  const bool isLeap = year % 4 == 0 && (year % 100 != 0 || year % 400 == 0);
  const int past = year - 1;
  const int leapDays = past / 4 - past / 100 + past / 400;
  constexpr int leapDaysBefore2001 = 500 - 20 + 5;
  return (year - 2001) * 365 + leapDays - leapDaysBefore2001 + beforeMonth[month - 1] + day - 1 +
         (isLeap && month > 2 ? 1 : 0);
}

constexpr int daysInMonth(int year, int month) noexcept {
  return month == 12 ? 31 : daysSince2001(year, month + 1, 1) - daysSince2001(year, month, 1);
}

}  // namespace

std::optional<Integer> parseInteger(std::string_view text) noexcept {
  if (const auto number = parseFewDigits(text)) return Integer{*number, false};
  text = trimmed(text);
  // Deliberate: no sign before 0x, no 0X, and no more than 16 digits, leading zeros included.
  if (text.starts_with("0x")) {
    if (text.size() > 18) return std::nullopt;
    const auto bits = parseDigits(text.substr(2), 16);
    if (!bits) return std::nullopt;
    return Integer{*bits, false};
  }
  const auto magnitude = parseDigits(unsignedPart(text), 10);
  if (!magnitude) return std::nullopt;
  // Minus zero is zero: an integer has no sign then.
  if (!text.starts_with('-') || *magnitude == 0) return Integer{*magnitude, false};
  // 2^63 itself has a negative and no positive form in 64 bits with sign.
  if (*magnitude > std::uint64_t{1} << 63) return std::nullopt;
  return Integer{~*magnitude + 1, true};
}

std::optional<double> parseReal(std::string_view text) noexcept {
  text = trimmed(text);
  const bool isNegative = text.starts_with('-');
  text = unsignedPart(text);
  double number = 0;
  if (isWord(text, "nan")) {
    number = std::numeric_limits<double>::quiet_NaN();
  } else if (isWord(text, "inf") || isWord(text, "infinity")) {
    number = std::numeric_limits<double>::infinity();
  } else {
    if (!isDecimal(text)) return std::nullopt;
    // Deliberate: a number too small for a double is refused as one too large is. Read as zero, it
    // would pass a test for zero that its writer never meant.
    const auto result = std::from_chars(text.data(), text.data() + text.size(), number);
    if (result.ec != std::errc{}) return std::nullopt;
  }
  return isNegative ? -number : number;
}

std::optional<double> parseDate(std::string_view text) noexcept {
  text = trimmed(text);
  constexpr std::string_view form = "0000-00-00T00:00:00Z";
  // Every place, so that what follows reads digits and nothing else.
  const bool fits = std::ranges::equal(
      text, form, [](char c, char model) { return model == '0' ? isDigit(c) : c == model; });
  if (!fits) return std::nullopt;
  const auto number = [text](std::size_t at, std::size_t length) {
    int value = 0;
    for (const char digit : text.substr(at, length)) value = value * 10 + (digit - '0');
    return value;
  };
  const int year = number(0, 4);
  const int month = number(5, 2);
  const int day = number(8, 2);
  const int hour = number(11, 2);
  const int minute = number(14, 2);
  const int second = number(17, 2);
  // Deliberate: no second 60. A leap second has no place in seconds counted without them.
  if (year < 1 || month < 1 || month > 12 || day < 1 || day > daysInMonth(year, month) ||
      hour > 23 || minute > 59 || second > 59) {
    return std::nullopt;
  }
  return 86400.0 * daysSince2001(year, month, day) + (hour * 60 + minute) * 60 + second;
}

}  // namespace PropertyList
