// SPDX-License-Identifier: Apache-2.0
/// Two readers must agree: random trees, written in both formats, read back as what they were.
#include <limits>
#include <random>
#include <stdexcept>

#include "plist/test_messages.h"
#include "plist/writer.h"

namespace PropertyList {
namespace {

class Trees {
 public:
  explicit Trees(std::uint32_t seed) : random_(seed) {}

  Tree next(int depth) {
    switch (below(depth > 0 ? 9 : 7)) {
      case 0:
        return below(2) == 0;
      case 1:
        return static_cast<std::int64_t>(bits() >> below(64)) - (below(2) == 0 ? 5 : 0);
      case 2:
        return bits() | std::uint64_t{1} << 63;
      case 3:
        return static_cast<double>(bits()) / static_cast<double>(1 + below(1000)) - 1e18;
      case 4:
        return Date{static_cast<double>(bits() % 300'000'000'000u) - 6e10};
      case 5:
        return text();
      case 6:
        return Data(below(2000), static_cast<std::byte>(below(256)));
      case 7: {
        Array elements;
        for (std::size_t i = below(20); i > 0; --i) elements.push_back(next(depth - 1));
        return elements;
      }
      default: {
        Dictionary entries;
        for (std::size_t i = below(40); i > 0; --i) {
          entries.emplace_back(std::to_string(i) + text(), next(depth - 1));
        }
        return entries;
      }
    }
  }

 private:
  std::uint64_t bits() { return random_() << 32 | random_(); }
  std::size_t below(std::size_t limit) { return static_cast<std::size_t>(random_() % limit); }
  std::string text() {
    static constexpr std::string_view pieces[] = {
        "sixteen letters ", "<&>\"",           "]]>", "\r", "\n", "\xC3\xA9",
        "\xE6\xBC\xA2",     "\xF0\x9F\x98\x80"};
    std::string out;
    for (std::size_t i = below(8); i > 0; --i) out += pieces[below(std::size(pieces))];
    return out;
  }

  std::mt19937_64 random_;
};

TEST(Twins, RandomTreesReadBackFromBothFormats) {
  for (std::uint32_t seed = 0; seed < 300; ++seed) {
    const Tree tree = Trees(seed).next(4);
    EXPECT_EQ(treeOf(writeBinary(tree)), tree) << seed;
    EXPECT_EQ(read(writeXml(tree)), tree) << seed;
  }
}

TEST(Twins, WidthsOfReferencesAndOffsets) {
  for (const std::size_t count : {254u, 255u, 256u, 257u, 65'534u, 65'535u, 65'536u, 65'537u}) {
    Array elements;
    for (std::size_t i = 0; i < count; ++i) elements.emplace_back(i);
    const auto message = writeBinary(elements);
    const Document document(message);
    std::uint64_t expected = 0;
    for (const Value value : document.top().elements()) {
      ASSERT_EQ(value.integer(), (Integer{expected++, false}));
    }
    EXPECT_EQ(expected, count);
  }
}

TEST(Writers, RefuseWhatTheFormatHasNot) {
  for (const Tree& tree :
       {Tree(nullptr), Tree(Uid{1}), Tree(Set{}), Tree(Date{0.5}), Tree(Date{-63'113'904'001}),
        Tree(Date{252'423'993'600}), Tree("\x01"), Tree("\xEF\xBF\xBF"), Tree("\xFF")}) {
    EXPECT_THROW(writeXml(tree), std::invalid_argument);
  }
  EXPECT_THROW(writeBinary("\xC0\x80"), std::invalid_argument);
  EXPECT_THROW(writeBinary(Date{std::numeric_limits<double>::infinity()}), std::invalid_argument);
}

TEST(Writers, ShareEqualScalarsAndUseNarrowWidths) {
  const auto message = writeBinary(Array{"x", "x", 1, 1u, Dictionary{{"x", 1}}, -1});
  const std::string expected = bytes("bplist00\xA6\1\1\2\2\3\4\x51x\x10\1\xD1\1\2\x13") +
                               bigEndian(~0ull, 8) + bytes("\x08\x0F\x11\x13\x16\0\0\0\0\0\0") +
                               bytes("\1\1") + bigEndian(5, 8) + bigEndian(0, 8) + bigEndian(31, 8);
  EXPECT_EQ(std::string(reinterpret_cast<const char*>(message.data()), message.size()), expected);
}

}  // namespace
}  // namespace PropertyList
