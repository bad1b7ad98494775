// SPDX-License-Identifier: Apache-2.0
// Values as JSON text, and what it may cost. Whole records are compared by the examples' test.
#include "framework/json/values.h"

#include <keelgate/errors.h>

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace Keelgate::JSON {
namespace {

String textIn(Writer&& out) {
  String all;
  for (const String& piece : std::move(out).take()) all += piece;
  EXPECT_EQ(all.back(), '\n');
  all.pop_back();
  return all;
}

template <class T>
String compact(const T& value) {
  Writer out(Layout::compact);
  write(out, value);
  return textIn(std::move(out));
}

TEST(JSON, DatesOutsideTheCalendarAreNumbers) {
  EXPECT_EQ(compact(Date{-63113904001}), "-63113904001.0");
}

TEST(JSON, StringsCanNeitherEndNorDriveATerminal) {
  const std::pair<std::string_view, const char*> table[] = {
      {"", R"("")"},
      {"a\"b\\c/", R"("a\"b\\c/")"},
      {std::string_view("\0\x1f\n\r\t ~", 7), R"("\u0000\u001f\n\r\t ~")"},
      // What a terminal obeys in eight bits too.
      {"\x1b[2J\x7f\u0080\u009f", R"("\u001b[2J\u007f\u0080\u009f")"},
      // What ends a line for readers that know Unicode.
      {"a\u2028b\u2029", R"("a\u2028b\u2029")"},
      {"\u00a0\u00e9\u2027\u202a\u20ac\U0001f600", "\"\u00a0\u00e9\u2027\u202a\u20ac\U0001f600\""},
      // Bytes of a path that are not UTF-8: alone, cut off, overlong, half a surrogate pair.
      {"a\xff\xe2\x82"
       "b",
       R"("a\udcff\udce2\udc82b")"},
      {"\xc0\x80\xed\xa0\x80", R"("\udcc0\udc80\udced\udca0\udc80")"},
  };
  for (const auto& [value, text] : table) {
    EXPECT_EQ(compact(String(value)), text);
    EXPECT_EQ(quote(value), text);
  }
}

TEST(JSON, LongValuesAreWholeWhateverPiecesTheyAreMadeIn) {
  const std::size_t piece = std::size_t{64} << 10;
  for (std::size_t size : {piece - 1, piece, piece + 1, 3 * piece / 4, 3 * piece + 2}) {
    const String text(size, 'x');
    EXPECT_TRUE(compact(text) == '"' + text + '"') << size;
    // Seven bits of each character, so that every group of four is the same.
    String encoded(size / 3 * 4, 'A');
    if (size % 3 != 0) encoded += size % 3 == 1 ? "AA==" : "AAA=";
    EXPECT_TRUE(compact(Data(size)) == '"' + encoded + '"') << size;
  }
}

TEST(JSON, TheBudgetIsKeptToTheByte) {
  using Reason = HostError::Reason;
  const auto outcome = [](Layout layout, std::size_t values, Budget budget) -> Optional<Reason> {
    try {
      Writer out(layout, budget);
      for (std::size_t i = 0; i < values; ++i) out.integer(UInt64{7});
      static_cast<void>(std::move(out).take());
      return std::nullopt;
    } catch (const HostError& error) {
      return error.reason;
    }
  };
  const auto passed = std::chrono::steady_clock::now() - std::chrono::seconds(1);
  for (Layout layout : {Layout::compact, Layout::discarded}) {
    for (std::size_t size : {std::size_t{1}, std::size_t{1} << 16, std::size_t{1'000'000}}) {
      EXPECT_EQ(outcome(layout, size, {.bytes = size + 1}), std::nullopt);
      EXPECT_EQ(outcome(layout, size, {.bytes = size}), Reason::resourcesExhausted);
    }
    EXPECT_EQ(outcome(layout, 1, {.deadline = passed}), Reason::timedOut);
  }
}

}  // namespace
}  // namespace Keelgate::JSON
