// SPDX-License-Identifier: Apache-2.0
#include "plist/document.h"

#include "plist/test_messages.h"
#include "plist/writer.h"

#include <cmath>
#include <limits>
#include <stdexcept>

namespace PropertyList {
namespace {

std::string element(const std::string& name, const std::string& content) {
  return xml("<" + name + ">" + content + "</" + name + ">");
}

/// Wherever it stands: what reads many bytes at a time has an edge somewhere.
TEST(Document, XmlTextMeansWhatXmlSaysAtEveryPlace) {
  const std::pair<std::string, std::string> pieces[] = {
      {"", ""},
      {" a\tb\n", " a\tb\n"},
      {"&lt;&gt;&amp;&quot;&apos;&#65;&#x1F600;", "<>&\"'A\xF0\x9F\x98\x80"},
      {"a\r\nb\rc&#13;d", "a\nb\nc\rd"},
      {"<![CDATA[<&\r\n]]]]><![CDATA[>]]>x", "<&\n]]>x"},
      {"a<!--<-->b<?or this?>c", "abc"},
      {"]] > ]", "]] > ]"},
      {"&amp;lt;", "&lt;"},
      {"\xC3\xA9\x7F\xE6\xBC\xA2", "\xC3\xA9\x7F\xE6\xBC\xA2"}};
  for (std::size_t before = 0; before < 40; ++before) {
    for (std::size_t after : {0u, 1u, 15u, 17u}) {
      const std::string left(before, 'x'), right(after, 'y');
      std::string content, meaning;
      for (const auto& [spelt, meant] : pieces) {
        EXPECT_EQ(read(element("string", left + spelt + right)), Tree(left + meant + right));
        content += left + spelt + right;
        meaning += left + meant + right;
      }
      EXPECT_EQ(read(element("string", content)), Tree(meaning));
      for (const std::string bad : {"\x1F", "\x80", "]]>", "&"}) {
        EXPECT_NE(problemIn(element("string", left + bad + right)), std::nullopt);
      }
    }
  }
}

TEST(Document, Utf16) {
  const auto utf16 = [](std::initializer_list<std::uint64_t> units) {
    std::string text(1, static_cast<char>(0x60 + units.size()));
    for (const std::uint64_t unit : units) text += bigEndian(unit, 2);
    return binary({text});
  };
  const std::pair<std::string, Tree> sound[] = {
      {utf16({0x7F, 0x80, 0x7FF, 0x800, 0xD7FF, 0xE000, 0xFFFF, 0}),
       bytes("\x7F\xC2\x80\xDF\xBF\xE0\xA0\x80\xED\x9F\xBF\xEE\x80\x80\xEF\xBF\xBF\0")},
      {utf16({0xD800, 0xDC00, 0xDBFF, 0xDFFF}), "\xF0\x90\x80\x80\xF4\x8F\xBF\xBF"}};
  for (const auto& [message, text] : sound) {
    EXPECT_EQ(read(message), text);
    EXPECT_EQ(treeOf(writeBinary(text)), text);
  }
}

TEST(Document, NumbersOfItsObjectsMayBeOfAnyWidth) {
  for (std::size_t size = 1; size <= 8; ++size) {
    const Raw raw{{"\xA2" + bigEndian(2, size) + bigEndian(1, size), "\x09", "\x08"}, size, size};
    EXPECT_EQ(read(raw.message()), Tree(Array{false, true})) << size;
  }
}

TEST(Document, AskingForAnotherTypeIsRefused) {
  const std::string message = xml("<dict><key>a</key><integer>1</integer></dict>");
  const Document document(bytesOf(message));
  const Value top = document.top();
  EXPECT_EQ(top.count(), 1u);
  const Value number = (*top.entries().begin()).value;
  EXPECT_THROW(number.real(), std::logic_error);
  EXPECT_THROW(number.count(), std::logic_error);
  EXPECT_THROW(number.entries(), std::logic_error);
  EXPECT_THROW(top.elements(), std::logic_error);
}

TEST(Writers, RefuseWhatTheFormatHasNot) {
  EXPECT_THROW(writeXml("\x01"), std::invalid_argument);
  EXPECT_THROW(writeBinary("\xC0\x80"), std::invalid_argument);
  EXPECT_THROW(writeBinary(Date{std::numeric_limits<double>::infinity()}), std::invalid_argument);
}

constexpr std::int64_t lowest = std::numeric_limits<std::int64_t>::min();
constexpr std::uint64_t highest = std::numeric_limits<std::uint64_t>::max();

TEST(Numbers, BinaryIntegers) {
  const std::string ones(8, '\xFF');
  const std::string zeros(8, '\0');
  const std::string top = "\x80" + std::string(7, '\0');
  const std::pair<std::string, Tree> sound[] = {{"\x10\xFF", 255},
                                                {"\x11\xFF\xFF", 0xFFFF},
                                                {"\x12\xFF\xFF\xFF\xFF", 0xFFFF'FFFFll},
                                                {"\x13" + ones, -1},
                                                {"\x14" + zeros + ones, highest},
                                                {"\x14" + zeros + zeros, 0},
                                                {"\x14" + ones + ones, -1},
                                                {"\x14" + ones + top, lowest}};
  for (const auto& [object, number] : sound) EXPECT_EQ(read(binary({object})), number) << object;
}

TEST(Numbers, XmlIntegers) {
  for (const char* text : {"12", "+12", "\n 0012\t", "0xc", "0xC", "0x000000000000000C",
                           "00000000000000000000000000000000000012", "1<!-- -->2", "&#49;2"}) {
    EXPECT_EQ(read(element("integer", text)), Tree(12)) << text;
  }
  const std::string zero = element("integer", "-0");
  EXPECT_EQ(Document(bytesOf(zero)).top().integer(), (Integer{0, false}));
  const std::pair<const char*, Tree> sound[] = {{"-0", 0},
                                                {"-007", -7},
                                                {"0x0", 0},
                                                {"0xaF09", 0xAF09},
                                                {"0xFFFFFFFFFFFFFFFF", highest},
                                                {"18446744073709551615", highest},
                                                {"-9223372036854775808", lowest}};
  for (const auto& [text, number] : sound) EXPECT_EQ(read(element("integer", text)), number);
}

TEST(Numbers, Reals) {
  for (const char* text : {"1", "-1.5", "+.5", "5.", " 1e3\n", "1E-2", "2.5e+1", "inf", "-Infinity",
                           "+INF", "5e-324", "1.7976931348623157e308", "0e999999999999", "0.1"}) {
    EXPECT_EQ(read(element("real", text)), Tree(std::strtod(text, nullptr))) << text;
  }
  for (const char* text : {"nan", "NaN", "-NAN"}) {
    EXPECT_TRUE(std::isnan(std::get<double>(read(element("real", text)).value))) << text;
  }
  EXPECT_TRUE(std::signbit(std::get<double>(read(element("real", "-0.0")).value)));
  EXPECT_EQ(read(binary({bytes("\x22\xBF\x00\x00\x00")})), Tree(-0.5));
  EXPECT_EQ(read(binary({"\x23\x7F\xF0" + std::string(6, '\0')})),
            Tree(std::numeric_limits<double>::infinity()));
  EXPECT_EQ(read(binary({"\x22\xFF\x80" + std::string(2, '\0')})),
            Tree(-std::numeric_limits<double>::infinity()));
}

TEST(Numbers, Dates) {
  EXPECT_EQ(read(element("date", " 2000-12-31T23:59:59Z\n")), Tree(Date{-1}));
}

}  // namespace
}  // namespace PropertyList
