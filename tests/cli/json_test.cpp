// SPDX-License-Identifier: Apache-2.0
// Values as JSON text. Whole records are compared by the examples' test.
#include "cli/json.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace Keelgate::CLI {
namespace {

template <class T>
String compact(const T& value) {
  rapidjson::StringBuffer buffer;
  rapidjson::Writer out(buffer);
  writeJson(out, value);
  return {buffer.GetString(), buffer.GetSize()};
}

Bytes bytesOf(std::string_view text) {
  return std::as_bytes(std::span(text.data(), text.size()));
}

TEST(Json, dates) {
  constexpr double yearOne = -63113904000, yearTenThousand = 252423993600;
  const std::pair<double, const char*> table[] = {
      {0, "\"2001-01-01T00:00:00Z\""},
      {817034400, "\"2026-11-22T10:00:00Z\""},
      {0.5, "\"2001-01-01T00:00:00.5Z\""},
      {0.25, "\"2001-01-01T00:00:00.25Z\""},
      {0.1, "\"2001-01-01T00:00:00.1Z\""},
      {0.000001, "\"2001-01-01T00:00:00.000001Z\""},
      {0.0000004, "\"2001-01-01T00:00:00Z\""},
      {0.9999996, "\"2001-01-01T00:00:01Z\""},
      {59.9999996, "\"2001-01-01T00:01:00Z\""},
      {-1e-20, "\"2001-01-01T00:00:00Z\""},
      {-0.5, "\"2000-12-31T23:59:59.5Z\""},
      {-0.0000004, "\"2001-01-01T00:00:00Z\""},
      // A rounding that carries over into another year.
      {31535999.9999999, "\"2002-01-01T00:00:00Z\""},
      {-26524800, "\"2000-02-29T00:00:00Z\""},
      {yearOne, "\"0001-01-01T00:00:00Z\""},
      {yearOne - 1, "-63113904001.0"},
      // The last moment of year 0: neighbours are 8 microseconds apart here.
      {std::nextafter(yearOne, -1e12), "-63113904000.00001"},
      {yearTenThousand - 1, "\"9999-12-31T23:59:59Z\""},
      {std::nextafter(yearTenThousand, 0), "\"9999-12-31T23:59:59.999969Z\""},
      {yearTenThousand, "252423993600.0"},
      {1e300, "1e+300"},
      {-1e300, "-1e+300"},
  };
  for (const auto& [seconds, text] : table) EXPECT_EQ(compact(Date{seconds}), text) << seconds;
}

TEST(Json, numbers) {
  const std::pair<double, const char*> table[] = {
      {3, "3.0"},
      {-0.0, "-0.0"},
      {0.1, "0.1"},
      {5e-324, "5e-324"},
      {NAN, "\"nan\""},
      {INFINITY, "\"inf\""},
      {-INFINITY, "\"-inf\""},
  };
  for (const auto& [number, text] : table) EXPECT_EQ(compact(number), text);
  EXPECT_EQ(compact(std::numeric_limits<Int>::min()), "-9223372036854775808");
  EXPECT_EQ(compact(std::numeric_limits<UInt64>::max()), "18446744073709551615");
}

TEST(Json, everyPowerOfTwoAndItsNeighboursReadBack) {
  for (int exponent = -1074; exponent <= 1023; ++exponent) {
    const double power = std::ldexp(1, exponent);
    for (double number : {std::nextafter(power, 0), power, -std::nextafter(power, INFINITY)}) {
      const String text = compact(number);
      EXPECT_EQ(std::strtod(text.c_str(), nullptr), number) << text;
      EXPECT_NE(text.find_first_of(".e"), String::npos) << text;
    }
  }
}

TEST(Json, strings) {
  const std::pair<std::string_view, const char*> table[] = {
      {"", R"("")"},
      {"a\"b\\c/", R"("a\"b\\c/")"},
      {std::string_view("\0\x1f\n\r\t", 5), R"("\u0000\u001f\n\r\t")"},
      // What a terminal obeys in eight bits too.
      {"\x1b[2J\x7f\u0085\u009b", R"("\u001b[2J\u007f\u0085\u009b")"},
      // What ends a line for readers that know Unicode.
      {"a\u2028b\u2029", R"("a\u2028b\u2029")"},
      {"\u00a0\u00e9\u20ac\U0001f600", "\"\u00a0\u00e9\u20ac\U0001f600\""},
      // Bytes of a path that are no UTF-8: alone, cut off, overlong, half a surrogate pair.
      {"a\xff\xe2\x82"
       "b",
       "\"a\ufffd\ufffd\ufffdb\""},
      {"\xc0\x80\xed\xa0\x80", "\"\ufffd\ufffd\ufffd\ufffd\ufffd\""},
  };
  for (const auto& [value, text] : table) EXPECT_EQ(compact(String(value)), text);
}

TEST(Json, base64GoesBothWaysStrictly) {
  const std::pair<std::string_view, const char*> table[] = {{"", "\"\""},
                                                            {"f", "\"Zg==\""},
                                                            {"fo", "\"Zm8=\""},
                                                            {"foo", "\"Zm9v\""},
                                                            {"\xfb\xff", "\"+/8=\""}};
  for (const auto& [octets, text] : table) {
    const Data data(bytesOf(octets).begin(), bytesOf(octets).end());
    EXPECT_EQ(compact(data), text);
    const std::string_view quoted(text);
    EXPECT_EQ(fromBase64(quoted.substr(1, quoted.size() - 2)), data);
  }
  for (const char* wrong : {"Z", "Zg", "Zg=", "Zg===", "Zh==", "Zm9=", "Zm9v\n", " Zm9v", "Zm-_",
                            "Zg==Zg==", "====", "Zm9v="}) {
    EXPECT_EQ(fromBase64(wrong), std::nullopt) << wrong;
  }
}

}  // namespace
}  // namespace Keelgate::CLI
