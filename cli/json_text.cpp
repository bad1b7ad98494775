// SPDX-License-Identifier: Apache-2.0
/// Whoever reads the command's output takes it for well-formed JSON that cannot move a cursor. Both
/// are decided here, character by character.
#include "cli/json_text.h"

#include <fmt/format.h>
#include <rapidjson/encodings.h>
#include <rapidjson/memorystream.h>
#include <sodium.h>

#include <chrono>
#include <cmath>
#include <iterator>

namespace Keelgate::CLI {

namespace {

namespace chrono = std::chrono;

constexpr int base64 = sodium_base64_VARIANT_ORIGINAL;

constexpr chrono::sys_seconds referenceDate = chrono::sys_days(chrono::year(2001) / 1 / 1);
/// Years of four digits: from here to before endOfTime.
constexpr chrono::sys_seconds firstSecond = chrono::sys_days(chrono::year(1) / 1 / 1);
constexpr chrono::sys_seconds endOfTime = chrono::sys_days(chrono::year(10000) / 1 / 1);

/// The character at the stream's position, or nothing when it is none or truncated.
Optional<unsigned> nextCharacter(rapidjson::MemoryStream& stream) {
  unsigned codePoint = 0;
  if (!rapidjson::UTF8<>::Decode(stream, &codePoint)) return std::nullopt;
  return codePoint;
}

/// The short escapes are those that people expect to see; all others are numbers.
void appendQuoted(String& to, unsigned codePoint, std::string_view bytes) {
  switch (codePoint) {
    case '"':
    case '\\':
      to += '\\';
      to += bytes;
      return;
    case '\n':
      to += "\\n";
      return;
    case '\r':
      to += "\\r";
      return;
    case '\t':
      to += "\\t";
      return;
    default:
      break;
  }
  const Bool control = codePoint < 0x20 || (codePoint >= 0x7f && codePoint < 0xa0);
  const Bool lineEnd = codePoint == 0x2028 || codePoint == 0x2029;
  // All of these are in the basic plane, so four digits do.
  if (control || lineEnd) {
    fmt::format_to(std::back_inserter(to), "\\u{:04x}", codePoint);
  } else {
    to += bytes;
  }
}

/// Calls `use(character, bytes)` for every character; without a character for a byte that begins
/// none.
template <class Use>
void eachCharacter(std::string_view text, Use use) {
  while (!text.empty()) {
    rapidjson::MemoryStream stream(text.data(), text.size());
    const Optional<unsigned> character = nextCharacter(stream);
    const std::size_t length = character ? stream.Tell() : 1;
    use(character, text.substr(0, length));
    text.remove_prefix(length);
  }
}

}  // namespace

String jsonString(std::string_view text) {
  String to = "\"";
  to.reserve(text.size() + 2);
  eachCharacter(text, [&](Optional<unsigned> character, std::string_view bytes) {
    if (character) {
      appendQuoted(to, *character, bytes);
    } else {
      // U+FFFD, one for each byte: the length still shows how much was there.
      to += "\xef\xbf\xbd";
    }
  });
  return to += '"';
}

Bool isUtf8(std::string_view text) {
  Bool valid = true;
  eachCharacter(text, [&](Optional<unsigned> character, std::string_view) {
    if (!character) valid = false;
  });
  return valid;
}

String numberText(Double value) {
  if (std::isnan(value)) return "\"nan\"";
  if (std::isinf(value)) return value > 0 ? "\"inf\"" : "\"-inf\"";
  String text = fmt::format("{}", value);
  // Else a reader that tells integers from fractions would take 3.0 for an integer.
  if (text.find_first_of(".e") == String::npos) text += ".0";
  return text;
}

String dateText(Date date) {
  const double seconds = date.secondsSinceReferenceDate;
  const double whole = std::floor(seconds);
  // Formatted and not multiplied: a product would round once more. "1.000000" carries over, which
  // a fraction that is no more than a breath below zero does too.
  String fraction = fmt::format("{:.6f}", seconds - whole);
  const double second = whole + (fraction.front() == '1' ? 1 : 0);
  const auto inRange = [&](chrono::sys_seconds limit) {
    return second < static_cast<double>((limit - referenceDate).count());
  };
  if (!std::isfinite(seconds) || inRange(firstSecond) || !inRange(endOfTime)) {
    return numberText(seconds);
  }

  const chrono::sys_seconds time = referenceDate + chrono::seconds(static_cast<Int>(second));
  const auto midnight = chrono::floor<chrono::days>(time);
  const chrono::year_month_day day(midnight);
  const chrono::hh_mm_ss clock(time - midnight);
  // Left with the point and the digits that are needed.
  fraction.erase(0, 1);
  fraction.erase(fraction.find_last_not_of('0') + 1);
  if (fraction == ".") fraction.clear();
  return fmt::format("\"{:04}-{:02}-{:02}T{:02}:{:02}:{:02}{}Z\"", static_cast<int>(day.year()),
                     static_cast<unsigned>(day.month()), static_cast<unsigned>(day.day()),
                     clock.hours().count(), clock.minutes().count(), clock.seconds().count(),
                     fraction);
}

String uuidText(const UUID& uuid) {
  String text = "\"";
  for (std::size_t i = 0; i < uuid.octets.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    fmt::format_to(std::back_inserter(text), "{:02X}", uuid.octets[i]);
  }
  return text += '"';
}

String base64Text(Bytes bytes) {
  // The length counts a terminating null, which becomes the closing quote.
  String text(sodium_base64_encoded_len(bytes.size(), base64) + 1, '"');
  sodium_bin2base64(text.data() + 1, text.size() - 1,
                    reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size(), base64);
  text.back() = '"';
  return text;
}

Optional<Data> fromBase64(std::string_view text) {
  if (text.size() % 4 != 0) return std::nullopt;
  // An empty list of bytes has no address, and the library wants one.
  if (text.empty()) return Data();
  Data bytes(text.size() / 4 * 3);
  std::size_t length = 0;
  const int failed = sodium_base642bin(reinterpret_cast<unsigned char*>(bytes.data()), bytes.size(),
                                       text.data(), text.size(), nullptr, &length, nullptr, base64);
  if (failed != 0) return std::nullopt;
  bytes.resize(length);
  return bytes;
}

}  // namespace Keelgate::CLI
