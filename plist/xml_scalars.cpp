// SPDX-License-Identifier: Apache-2.0
// Spellings are checked here in full; from_chars only converts what has been found sound.
#include "plist/xml_scalars.h"

#include <algorithm>
#include <charconv>
#include <limits>

#include "text/ascii.h"
#include "text/date_time.h"

namespace PropertyList {
namespace {

using Text::isDigit;
using Text::lowerCase;

// Letters of ASCII alone: in some locales I is not the capital of i.
bool isWord(std::string_view text, std::string_view word) noexcept {
  return std::ranges::equal(text, word, {}, lowerCase);
}

std::string_view trimmed(std::string_view text) noexcept {
  while (!text.empty() && Text::isSpace(text.front())) text.remove_prefix(1);
  while (!text.empty() && Text::isSpace(text.back())) text.remove_suffix(1);
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
  if (lowerCase(text[0]) != 'e') return false;
  text = unsignedPart(text.substr(1));
  return digits() > 0 && text.empty();
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
  return Text::parseDateTime(trimmed(text));
}

}  // namespace PropertyList
