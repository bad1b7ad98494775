// SPDX-License-Identifier: Apache-2.0
#include "plist/xml/scalars.h"

#include "text/ascii.h"
#include "text/date_time.h"

#include <algorithm>
#include <charconv>
#include <limits>

namespace PropertyList {
namespace {

/// Letters of ASCII alone: in some locales I is not the capital of i.
bool isWord(std::string_view text, std::string_view word) noexcept {
  return std::ranges::equal(text, word, {}, Text::lowerCase);
}

std::string_view trimmed(std::string_view text) noexcept {
  while (!text.empty() && Text::isSpace(text.front())) text.remove_prefix(1);
  while (!text.empty() && Text::isSpace(text.back())) text.remove_suffix(1);
  return text;
}

/// Takes the sign off; says whether it was a minus.
bool takeSign(std::string_view& text) noexcept {
  const bool isNegative = text.starts_with('-');
  if (isNegative || text.starts_with('+')) text.remove_prefix(1);
  return isNegative;
}

/// All of the text as one number. It must begin with what the caller has looked at: from_chars
/// knows signs and words of its own.
template <typename Number, typename... Form>
std::optional<Number> convert(std::string_view text, Form... form) noexcept {
  Number number{};
  const char* const end = text.data() + text.size();
  const auto [stop, error] = std::from_chars(text.data(), end, number, form...);
  if (error != std::errc{} || stop != end) return std::nullopt;
  return number;
}

}  // namespace

std::optional<Integer> parseInteger(std::string_view text) noexcept {
  text = trimmed(text);
  const bool isHex = text.starts_with("0x");
  const bool isNegative = !isHex && takeSign(text);
  if (isHex) text.remove_prefix(2);
  // No more digits than 64 bits have, so that their number says how wide the integer is.
  if (isHex && text.size() > 16) return std::nullopt;
  const auto magnitude = convert<std::uint64_t>(text, isHex ? 16 : 10);
  if (!magnitude) return std::nullopt;
  constexpr std::uint64_t lowest = std::uint64_t{1} << 63;
  if (isNegative && *magnitude > lowest) return std::nullopt;
  // -0 is 0, which has no sign.
  return Integer{isNegative ? 0 - *magnitude : *magnitude, isNegative && *magnitude != 0};
}

std::optional<double> parseReal(std::string_view text) noexcept {
  text = trimmed(text);
  const bool isNegative = takeSign(text);
  std::optional<double> number;
  if (isWord(text, "nan")) {
    number = std::numeric_limits<double>::quiet_NaN();
  } else if (isWord(text, "inf") || isWord(text, "infinity")) {
    number = std::numeric_limits<double>::infinity();
  } else if (text.starts_with('.') || (!text.empty() && Text::isDigit(text.front()))) {
    // Deliberate: a number too small for a double is refused as one too large is. Read as zero, it
    // would pass a test for zero that its writer never meant.
    number = convert<double>(text);
  }
  if (number && isNegative) number = -*number;
  return number;
}

std::optional<double> parseDate(std::string_view text) noexcept {
  return Text::parseDateTime(trimmed(text));
}

}  // namespace PropertyList
