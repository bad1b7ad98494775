// SPDX-License-Identifier: Apache-2.0
#include "text/date_time.h"

#include "text/ascii.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>

namespace Keelgate::Text {

namespace {

namespace chrono = std::chrono;

constexpr chrono::sys_seconds reference = chrono::sys_days(chrono::year(2001) / 1 / 1);
constexpr chrono::sys_seconds first = chrono::sys_days(chrono::year(1) / 1 / 1);
constexpr chrono::sys_seconds end = chrono::sys_days(chrono::year(10000) / 1 / 1);

constexpr double secondsUntil(chrono::sys_seconds time) {
  return static_cast<double>((time - reference).count());
}

}  // namespace

std::optional<std::string> dateTimeText(double seconds) {
  // Written so that it is false for NaN, too; and before anything is made an integer.
  if (!(seconds >= secondsUntil(first) && seconds < secondsUntil(end))) return std::nullopt;
  double whole = std::floor(seconds);
  // Converted and not multiplied: a product would round once more.
  std::array<char, 16> digits{};
  const char* last = std::to_chars(digits.data(), digits.data() + digits.size(), seconds - whole,
                                   std::chars_format::fixed, 6)
                         .ptr;
  // "1.000000" carries over.
  if (digits[0] == '1') ++whole;
  if (whole >= secondsUntil(end)) return std::nullopt;
  while (last[-1] == '0') --last;
  // Less than a digit behind the point: not even the point.
  const std::string_view fraction(
      digits.data() + 1, last[-1] == '.' ? 0 : static_cast<std::size_t>(last - digits.data() - 1));

  const chrono::sys_seconds time = reference + chrono::seconds(static_cast<long long>(whole));
  const auto midnight = chrono::floor<chrono::days>(time);
  const chrono::year_month_day day(midnight);
  const chrono::hh_mm_ss clock(time - midnight);
  std::array<char, 32> text{};
  const int length = std::snprintf(
      text.data(), text.size(), "%04d-%02u-%02uT%02d:%02d:%02d", static_cast<int>(day.year()),
      static_cast<unsigned>(day.month()), static_cast<unsigned>(day.day()),
      static_cast<int>(clock.hours().count()), static_cast<int>(clock.minutes().count()),
      static_cast<int>(clock.seconds().count()));
  return std::string(text.data(), static_cast<std::size_t>(length)).append(fraction) + 'Z';
}

std::optional<double> parseDateTime(std::string_view text) noexcept {
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
  const chrono::year_month_day day(chrono::year(number(0, 4)),
                                   chrono::month(static_cast<unsigned>(number(5, 2))),
                                   chrono::day(static_cast<unsigned>(number(8, 2))));
  const int hour = number(11, 2);
  const int minute = number(14, 2);
  const int second = number(17, 2);
  // Deliberate: second 60 is refused. A leap second has no place in seconds counted without them.
  if (day.year() < chrono::year(1) || !day.ok() || hour > 23 || minute > 59 || second > 59) {
    return std::nullopt;
  }
  return secondsUntil(chrono::sys_days(day)) + (hour * 60 + minute) * 60 + second;
}

}  // namespace Keelgate::Text
