// SPDX-License-Identifier: Apache-2.0
// Values as JSON text, and what it may cost. Whole records are compared by the examples' test.
#include "framework/json/values.h"

#include <keelgate/errors.h>

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <tuple>

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

Data dataOf(std::string_view text) {
  const Bytes bytes = std::as_bytes(std::span(text));
  return {bytes.begin(), bytes.end()};
}

TEST(JSON, NumbersAreExactAndTellTheirKind) {
  const std::pair<double, const char*> table[] = {{3, "3.0"},
                                                  {-0.0, "-0.0"},
                                                  {0.1, "0.1"},
                                                  {1e15, "1000000000000000.0"},
                                                  {0.1 + 0.2, "0.30000000000000004"},
                                                  {1e16, "1e+16"},
                                                  {1e-5, "0.00001"},
                                                  {9e-6, "9e-06"},
                                                  {5e-324, "5e-324"},
                                                  {NAN, "\"nan\""},
                                                  {INFINITY, "\"inf\""},
                                                  {-INFINITY, "\"-inf\""}};
  for (const auto& [number, text] : table) EXPECT_EQ(compact(number), text);
  // Dates are text within the calendar and numbers outside.
  EXPECT_EQ(compact(Date{0.1}), "\"2001-01-01T00:00:00.1Z\"");
  EXPECT_EQ(compact(Date{-63113904001}), "-63113904001.0");
  EXPECT_EQ(compact(std::numeric_limits<Int>::min()), "-9223372036854775808");
  EXPECT_EQ(compact(std::numeric_limits<UInt64>::max()), "18446744073709551615");
  EXPECT_EQ(compact(Array<Bool>{true, false}), "[true,false]");
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
  EXPECT_EQ(compact(dataOf("\xfb\xff")), "\"+/8=\"");
}

TEST(JSON, PropertyListsAreTreesAndTypedOnesLoseNothing) {
  using Value = PropertyListValue;
  const auto typed = [](const Value& value) {
    Writer out(Layout::compact);
    writeTyped(out, value);
    return textIn(std::move(out));
  };
  const UInt64 largest = std::numeric_limits<UInt64>::max();
  const std::tuple<Value, const char*, const char*> table[] = {
      {nullptr, "null", R"({"type":"null","value":null})"},
      {true, "true", R"({"type":"boolean","value":true})"},
      {Int64{-1}, "-1", R"({"type":"integer","value":-1})"},
      {Value(std::in_place_index<3>, largest), "18446744073709551615",
       R"({"type":"integer","value":18446744073709551615})"},
      {Double{2}, "2.0", R"({"type":"real","value":2.0})"},
      {-std::numeric_limits<Double>::infinity(), R"("-inf")", R"({"type":"real","value":"-inf"})"},
      {Date{0.1234567}, R"("2001-01-01T00:00:00.123457Z")", R"({"type":"date","value":0.1234567})"},
      {String("a\n"), R"("a\n")", R"({"type":"string","value":"a\n"})"},
      {dataOf("f"), R"("Zg==")", R"({"type":"data","value":"Zg=="})"},
      {PropertyListUID{0, largest}, R"({"uid":18446744073709551615})",
       R"({"type":"uid","value":18446744073709551615})"},
      {PropertyListUID{0x1a, 0xb}, R"({"uid":"0x1a000000000000000b"})",
       R"({"type":"uid","value":"0x1a000000000000000b"})"},
      {PropertyListSet{{Value(true)}}, "[true]",
       R"({"type":"set","value":[{"type":"boolean","value":true}]})"},
      {Array<Value>{}, "[]", R"({"type":"array","value":[]})"},
      {Array<PropertyListEntry>{{"z", Value(nullptr)}, {"a", Value(Array<Value>{Value(Int64{3})})}},
       R"({"z":null,"a":[3]})",
       R"({"type":"dictionary","value":{"z":{"type":"null","value":null},)"
       R"("a":{"type":"array","value":[{"type":"integer","value":3}]}}})"},
  };
  for (const auto& [value, plainText, typedText] : table) {
    EXPECT_EQ(compact(value), plainText);
    EXPECT_EQ(compact(PropertyList{value}), plainText);
    EXPECT_EQ(typed(value), typedText);
  }
  Writer pretty(Layout::pretty);
  write(pretty, std::get<0>(std::end(table)[-1]));
  EXPECT_EQ(textIn(std::move(pretty)), "{\n  \"z\": null,\n  \"a\": [\n    3\n  ]\n}");
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
