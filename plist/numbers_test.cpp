// SPDX-License-Identifier: Apache-2.0
#include <cmath>
#include <limits>

#include "plist/test_messages.h"
#include "plist/writer.h"

namespace PropertyList {
namespace {

constexpr std::int64_t lowest = std::numeric_limits<std::int64_t>::min();
constexpr std::uint64_t highest = std::numeric_limits<std::uint64_t>::max();

std::string integer(std::string_view text) {
  return xml("<integer>" + std::string(text) + "</integer>");
}
std::string real(std::string_view text) {
  return xml("<real>" + std::string(text) + "</real>");
}
std::string date(std::string_view text) {
  return xml("<date>" + std::string(text) + "</date>");
}

Tree readBack(const Tree& tree) {
  const std::string text = writeXml(tree);
  Tree back = treeOf(writeBinary(tree));
  EXPECT_EQ(back, read(text));
  return back;
}

TEST(Numbers, EveryPowerOfTwoPlusMinusOne) {
  for (unsigned shift = 0; shift < 64; ++shift) {
    for (const std::uint64_t offset : {highest, std::uint64_t{0}, std::uint64_t{1}}) {
      const std::uint64_t number = (std::uint64_t{1} << shift) + offset;
      const auto asSigned = static_cast<std::int64_t>(number);
      EXPECT_EQ(readBack(asSigned), Tree(asSigned));
      EXPECT_EQ(readBack(number), number >> 63 != 0 ? Tree(number) : Tree(asSigned));
      EXPECT_EQ(readBack(-static_cast<double>(number)), Tree(-static_cast<double>(number)));
    }
  }
}

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
  EXPECT_EQ(problemIn(binary({"\x14" + ones + zeros})), Problem::integerTooLarge);
  EXPECT_EQ(problemIn(binary({"\x14" + bigEndian(1, 8) + zeros})), Problem::integerTooLarge);
  EXPECT_EQ(problemIn(binary({"\x14" + top + ones})), Problem::integerTooLarge);
}

TEST(Numbers, XmlIntegers) {
  for (const char* text : {"12", "+12", "\n 0012\t", "0xc", "0xC", "0x000000000000000C",
                           "00000000000000000000000000000000000012", "1<!-- -->2", "&#49;2"}) {
    EXPECT_EQ(read(integer(text)), Tree(12)) << text;
  }
  const std::string zero = integer("-0");
  EXPECT_EQ(Document(bytesOf(zero)).top().integer(), (Integer{0, false}));
  const std::pair<const char*, Tree> sound[] = {{"-0", 0},
                                                {"-007", -7},
                                                {"0x0", 0},
                                                {"0xaF09", 0xAF09},
                                                {"0xFFFFFFFFFFFFFFFF", highest},
                                                {"18446744073709551615", highest},
                                                {"-9223372036854775808", lowest}};
  for (const auto& [text, number] : sound) EXPECT_EQ(read(integer(text)), number) << text;
  for (const char* text :
       {"", " ", "+", "-", "1 2", "1.0", "1e3", "0x", "0x1G", "0X1F", "-0x1", "+0x1", "0x-1", "x1",
        "+-1", "18446744073709551616", "-9223372036854775809", "0x00000000000000001", "\xD9\xA1"}) {
    EXPECT_EQ(problemIn(integer(text)), Problem::badInteger) << text;
  }
}

TEST(Numbers, Reals) {
  for (const char* text : {"1", "-1.5", "+.5", "5.", " 1e3\n", "1E-2", "2.5e+1", "inf", "-Infinity",
                           "+INF", "5e-324", "1.7976931348623157e308", "0e999999999999", "0.1"}) {
    EXPECT_EQ(read(real(text)), Tree(std::strtod(text, nullptr))) << text;
  }
  for (const char* text : {"nan", "NaN", "-NAN"}) {
    EXPECT_TRUE(std::isnan(std::get<double>(read(real(text)).value))) << text;
  }
  EXPECT_TRUE(std::signbit(std::get<double>(read(real("-0.0")).value)));
  for (const char* text : {"", ".", "+", "e5", "1e", "1e+", "0x1p3", "1,5", "1.2.3", "nan(1)",
                           "infi", "1 e5", "--1", "1e309", "-1e99999", "1e-400", "1f"}) {
    EXPECT_EQ(problemIn(real(text)), Problem::badReal) << text;
  }
  EXPECT_EQ(read(binary({bytes("\x22\xBF\x00\x00\x00")})), Tree(-0.5));
  EXPECT_EQ(read(binary({"\x23\x7F\xF0" + std::string(6, '\0')})),
            Tree(std::numeric_limits<double>::infinity()));
  EXPECT_EQ(read(binary({"\x22\xFF\x80" + std::string(2, '\0')})),
            Tree(-std::numeric_limits<double>::infinity()));
}

TEST(Numbers, Dates) {
  EXPECT_EQ(read(date(" 2000-12-31T23:59:59Z\n")), Tree(Date{-1}));
  EXPECT_EQ(problemIn(date("2001-02-29T00:00:00Z")), Problem::badDate);
}

}  // namespace
}  // namespace PropertyList
