// SPDX-License-Identifier: Apache-2.0
#include "text/base64.h"
#include "text/date_time.h"
#include "text/utf8.h"
#include "text/uuid.h"

#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <cstdint>
#include <limits>
#include <random>
#include <sstream>

namespace Keelgate::Text {
namespace {

std::optional<std::string> decoded(std::string_view text, Base64 form) {
  std::string out(base64Room(text.size()), '?');
  const auto length = decodeBase64(text, out.data(), form);
  // Where the text itself is the room, the answer is the same.
  std::string inPlace(text);
  EXPECT_EQ(decodeBase64(text, out.data(), form), decodeBase64(inPlace, inPlace.data(), form));
  if (!length) return std::nullopt;
  EXPECT_EQ(out.substr(0, *length), inPlace.substr(0, *length));
  return out.substr(0, *length);
}

TEST(Base64, EveryLengthReadsBackWhereverALineEnds) {
  std::mt19937 random(1);
  for (std::size_t length = 0; length < 200; ++length) {
    std::string bytes(length, '\0');
    for (char& byte : bytes) byte = static_cast<char>(random());
    std::string text = encodeBase64(std::as_bytes(std::span(bytes)));
    EXPECT_EQ(decoded(text, Base64::strict), bytes);
    for (std::size_t line = 1 + random() % 80; line < text.size(); line += 1 + random() % 80) {
      text.insert(line, "\r\n\t ");
    }
    EXPECT_EQ(decoded(text, Base64::spaced), bytes);
  }
}

TEST(Base64, SpellingsAreTakenAsTheFormSays) {
  using Spelling = std::pair<const char*, std::string>;
  const Spelling strict[] = {{"", ""},        {"Zg==", "f"},        {"Zm8=", "fo"},
                             {"Zm9v", "foo"}, {"Zm9vYg==", "foob"}, {"+/+/", "\xfb\xff\xbf"}};
  for (const auto& [text, bytes] : strict) {
    EXPECT_EQ(decoded(text, Base64::strict), bytes) << text;
    EXPECT_EQ(decoded(text, Base64::spaced), bytes) << text;
  }
  const Spelling spaced[] = {{"Zh==", "f"},     {"Zm+=", "fo"},        {"Zm9=", "fo"},
                             {" Zg= =\n", "f"}, {"Z\tm\r9\nv", "foo"}, {" \n", ""},
                             {"Zg== ", "f"}};
  for (const auto& [text, bytes] : spaced) {
    EXPECT_EQ(decoded(text, Base64::strict), std::nullopt) << text;
    EXPECT_EQ(decoded(text, Base64::spaced), bytes) << text;
  }
  for (const std::string_view text : {"Z", "Zg", "Zg=", "Zm9", "Z===", "=", "====", "Zg==Zg==",
                                      "Zg=v", "Zg===", "Zm9v=", "Zm9vZg==Zm9v", "Zm-_", "Zm9*",
                                      "Zm9vZ\xc3\xa9==", "Zm9vZm9vZm9vZm9v\x80m9v", "Zm9v\vZm9v"}) {
    EXPECT_FALSE(decoded(text, Base64::strict) || decoded(text, Base64::spaced)) << text;
  }
}

TEST(Utf8, EveryCharacterIsReadAsItIsWritten) {
  for (char32_t c = 0; c <= 0x10ffff; ++c) {
    if (isSurrogate(c)) continue;
    std::array<char, 4> bytes{};
    const std::string_view text(bytes.data(), encodeUtf8(c, bytes.data()));
    const Character first = firstCharacter(text);
    ASSERT_TRUE(first.codePoint == c && first.length == text.size()) << std::uint32_t{c};
    ASSERT_EQ(isUtf8(text), true) << std::uint32_t{c};
    ASSERT_EQ(isAscii(text), c < 0x80) << std::uint32_t{c};
    ASSERT_EQ(isUtf8(text.substr(0, text.size() - 1)), c < 0x80) << std::uint32_t{c};
  }
}

/// What reads many bytes at a time has a place for each of them.
TEST(Utf8, WhatIsMalformedIsFoundAnywhere) {
  // Overlong in two, three and four bytes; surrogates; beyond U+10FFFF; alone; cut short; not
  // continued.
  std::istringstream bads(
      "\xc0\xaf|\xc1\xbf|\xe0\x80\xaf|\xe0\x9f\xbf|\xf0\x80\x80\xaf|\xf0\x8f\xbf\xbf|"
      "\xed\xa0\x80|\xed\xbf\xbf|\xf4\x90\x80\x80|\xf5\x80\x80\x80|\x80|\xbf|\xff|\xc3|"
      "\xe2\x82|\xf0\x9f\x98|\xc3\x28|\xe2\x28\xa1|\xe2\x82\x28|\xf0\x28\x8c\xbc|"
      "\xf0\x90\x28\xbc|\xf0\x90\x8c\x28|\xc3\xc3");
  for (std::string bad; std::getline(bads, bad, '|');) {
    for (std::size_t before = 0; before < 70; ++before) {
      for (const std::size_t after : {0u, 1u, 64u, 100u}) {
        // Beside zeros a byte says the least.
        const char beside = before % 2 == 0 ? 'a' : '\0';
        std::string text = std::string(before, beside).append(bad).append(after, beside);
        EXPECT_FALSE(isUtf8(text)) << bad << before << ' ' << after;
        EXPECT_FALSE(isAscii(text)) << bad << before << ' ' << after;
        text.replace(before, bad.size(), "\xf0\x9f\x98\x80");
        EXPECT_TRUE(isUtf8(text)) << before << ' ' << after;
      }
    }
  }
}

TEST(DateTime, IsSpeltAsTheCalendarHasIt) {
  const std::pair<double, const char*> spellings[] = {{0, "2001-01-01T00:00:00Z"},
                                                      {-26'524'800, "2000-02-29T00:00:00Z"},
                                                      {-3'182'198'400, "1900-03-01T00:00:00Z"},
                                                      {-63'113'904'000, "0001-01-01T00:00:00Z"},
                                                      {252'423'993'599, "9999-12-31T23:59:59Z"},
                                                      {45'296, "2001-01-01T12:34:56Z"}};
  for (const auto& [seconds, text] : spellings) {
    EXPECT_EQ(dateTimeText(seconds), text);
    EXPECT_EQ(parseDateTime(text), seconds);
  }
  for (std::int64_t day = -730'485; day <= 2'921'573; day += 97) {
    const auto noon = static_cast<double>(day * 86'400 + 43'200);
    EXPECT_EQ(parseDateTime(*dateTimeText(noon)), noon) << day;
  }
}

TEST(DateTime, FractionsAreRoundedToMicroseconds) {
  const std::pair<double, const char*> spellings[] = {
      {0.000'001, "2001-01-01T00:00:00.000001Z"},
      {0.000'000'4, "2001-01-01T00:00:00Z"},
      {-0.25, "2000-12-31T23:59:59.75Z"},
      {59.999'999'9, "2001-01-01T00:01:00Z"},
      {-1e-20, "2001-01-01T00:00:00Z"},
      {252'423'993'599.999'97, "9999-12-31T23:59:59.999969Z"}};
  for (const auto& [seconds, text] : spellings) EXPECT_EQ(dateTimeText(seconds), text);
  constexpr double infinity = std::numeric_limits<double>::infinity();
  for (const double seconds : {-63'113'904'000.5, 252'423'993'600.0, 252'423'993'599.999'999'9,
                               1e300, infinity, -infinity, std::nan("")}) {
    EXPECT_EQ(dateTimeText(seconds), std::nullopt) << seconds;
  }
}

TEST(Uuid, IsReadInEitherCaseAndWrittenInUpperCase) {
  const std::string text = "00112233-4455-6677-8899-AABBCCDDEEFF";
  const UuidOctets octets = {0x00, 0x11, 0x22, 0x33, 0x44, 0x55, 0x66, 0x77,
                             0x88, 0x99, 0xaa, 0xbb, 0xcc, 0xdd, 0xee, 0xff};
  EXPECT_EQ(uuidText(octets), text);
  EXPECT_EQ(parseUuid(text), octets);
  EXPECT_EQ(parseUuid("00112233-4455-6677-8899-aabbccddeeff"), octets);
  EXPECT_EQ(parseUuid(""), std::nullopt);
  EXPECT_EQ(parseUuid(text + "0"), std::nullopt);
  for (std::size_t at = 0; at < text.size(); ++at) {
    for (const char other : {'-', 'G', 'g', '/', ':', '`', '@', ' ', '\0', '0'}) {
      // A digit may stand where there is no dash.
      if (text[at] == other || (text[at] != '-' && other == '0')) continue;
      std::string changed = text;
      changed[at] = other;
      EXPECT_EQ(parseUuid(changed), std::nullopt) << changed;
    }
  }
}

}  // namespace
}  // namespace Keelgate::Text
