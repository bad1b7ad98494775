// SPDX-License-Identifier: Apache-2.0
// Depth, sharing, overlap and repeated keys: the ways to make a small message expensive.
#include "plist/limits.h"
#include "plist/test_messages.h"
#include "plist/writer.h"

namespace PropertyList {
namespace {

TEST(Depth, LimitIsExactInXml) {
  // The innermost is empty: such ones count too.
  const auto nested = [](std::size_t depth) {
    std::string starts, ends;
    for (std::size_t i = 1; i < depth; ++i) {
      starts += "<array>";
      ends += "</array>";
    }
    return problemIn(xml(starts + "<dict/>" + ends));
  };
  EXPECT_EQ(nested(512), std::nullopt);
  EXPECT_EQ(nested(513), Problem::tooDeep);
  EXPECT_EQ(nested(100'000), Problem::tooDeep);
}

// [tail, chain]: the tail is walked first and alone, then hangs at the end of the chain.
std::string joined(std::size_t chain, std::size_t tail) {
  Raw raw{{"\xA2" + bigEndian(chain + 1, 2) + bigEndian(1, 2)}, 2, 4};
  for (std::size_t i = 1; i <= chain + tail; ++i) {
    raw.objects.push_back(i == chain + tail ? "\xA0" : "\xA1" + bigEndian(i + 1, 2));
  }
  return raw.message();
}

TEST(Depth, CountsEveryPathThroughSharedContainers) {
  EXPECT_EQ(problemIn(joined(300, 211)), std::nullopt);
  EXPECT_EQ(problemIn(joined(300, 212)), Problem::tooDeep);
  EXPECT_EQ(problemIn(joined(1, 511)), Problem::tooDeep);
  EXPECT_EQ(problemIn(joined(0, 511)), std::nullopt);
  EXPECT_EQ(problemIn(joined(0, 10'000)), Problem::tooDeep);
}

std::string doubling(std::size_t levels) {
  std::vector<std::string> objects;
  for (std::size_t i = 1; i <= levels; ++i)
    objects.push_back("\xA2" + std::string(2, static_cast<char>(i)));
  objects.push_back("\x51x");
  return binary(objects);
}

std::optional<Problem> problemInReading(const std::string& message) {
  try {
    read(message);
    return std::nullopt;
  } catch (const Damage& damage) {
    return damage.problem();
  }
}

TEST(Sharing, IsCheckedInLinearTimeAndPaidForWhenRead) {
  EXPECT_EQ(problemIn(doubling(64)), std::nullopt);
  EXPECT_EQ(problemInReading(doubling(64)), Problem::excessiveExpansion);
  EXPECT_EQ(problemInReading(doubling(8)), std::nullopt);

  // One long string and many references to it.
  Raw raw{{"\xAF\x12" + bigEndian(60'000, 4) + std::string(60'000, '\1'),
           "\x5F\x12" + bigEndian(60'000, 4) + std::string(60'000, 'x')}};
  EXPECT_EQ(problemIn(raw.message()), std::nullopt);
  EXPECT_EQ(problemInReading(raw.message()), Problem::excessiveExpansion);
}

TEST(Sharing, IsInheritedDownwards) {
  //  top: {"a": list, "b": list, "c": own}, list: ["x"], own: ["x"]
  const std::string message = binary({"\xD3\x01\x02\x03\x04\x04\x05", "\x51\x61", "\x51\x62",
                                      "\x51\x63", "\xA1\x06", "\xA1\x07", "\x51x", "\x51y"});
  const Document document(bytesOf(message));
  EXPECT_FALSE(document.top().isShared());
  for (const Entry entry : document.top().entries()) {
    const bool isShared = entry.key != "c";
    EXPECT_EQ(entry.value.isShared(), isShared) << entry.key;
    EXPECT_EQ((*entry.value.elements().begin()).isShared(), isShared) << entry.key;
  }
}

TEST(Sharing, TheBudgetFollowsTheMessage) {
  const std::string message = doubling(1);
  const Document document(bytesOf(message));
  const Value shared = *document.top().elements().begin();
  const std::size_t allowance = Limits::expansionBase + Limits::expansionFactor * message.size();
  ExpansionBudget budget(message.size());
  budget.spend(document.top(), 10 * allowance);
  budget.spend(shared, allowance - 1);
  budget.spend(shared, 1);
  EXPECT_THROW(budget.spend(shared, 1), Damage);
}

// Many object numbers for the same bytes: none is shared, yet each would be converted anew.
TEST(Sharing, OverlappingObjectsAreCharged) {
  const auto overlapping = [](std::size_t copies, std::size_t units) {
    const std::string list = "\xAF\x12" + bigEndian(copies, 4);
    std::string objects = "bplist00" + list;
    for (std::size_t i = 1; i <= copies; ++i) objects += bigEndian(i, 2);
    const std::size_t text = objects.size();
    objects += "\x6F\x12" + bigEndian(units, 4) + std::string(2 * units, 'x');
    const std::size_t table = objects.size();
    objects += bigEndian(8, 4);
    for (std::size_t i = 1; i <= copies; ++i) objects += bigEndian(text, 4);
    return objects + Raw{std::vector<std::string>(copies + 1), 2, 4}.trailer(table);
  };
  EXPECT_EQ(problemIn(overlapping(2, 10)), std::nullopt);
  EXPECT_EQ(problemIn(overlapping(10'000, 50'000)), Problem::overlappingObjects);
}

TEST(Keys, RepetitionIsFoundInDictionariesOfEverySize) {
  for (const std::size_t count : {2u, 8u, 9u, 17u, 156u, 10'000u}) {
    for (const std::size_t keyLength : {1u, 5u, 30u, 100u}) {
      Dictionary entries;
      for (std::size_t i = 0; i < count; ++i) {
        const std::string number = std::to_string(i * 7919 % 10'007);
        std::string key = number;
        key.append(keyLength, 'k').append(number);
        entries.emplace_back(std::move(key), true);
      }
      EXPECT_EQ(problemIn(writeBinary(entries)), std::nullopt) << count;
      EXPECT_EQ(problemIn(writeXml(entries)), std::nullopt) << count;
      entries.back().first = entries[count / 2 - 1].first;
      EXPECT_EQ(problemIn(writeBinary(entries)), Problem::duplicateKey) << count;
      EXPECT_EQ(problemIn(writeXml(entries)), Problem::duplicateKey) << count;
    }
  }
}

TEST(Keys, AreComparedByMeaning) {
  EXPECT_EQ(
      problemIn(binary({"\xD2\x01\x02\x03\x03", "\x52\x61\x62", bytes("\x62\0a\0b"), "\x09"})),
      Problem::duplicateKey);
  EXPECT_EQ(problemIn(binary({"\xD2\x01\x01\x02\x02", "\x51\x61", "\x09"})), Problem::duplicateKey);
  EXPECT_EQ(problemIn(xml("<dict><key>a&lt;</key><true/><key><![CDATA[a<]]></key><true/></dict>")),
            Problem::duplicateKey);
  EXPECT_EQ(problemIn(xml("<dict><key>a</key><dict><key>a</key><true/></dict></dict>")),
            std::nullopt);
}

// Fingerprints look at the beginning, middle and end of a key; these differ elsewhere.
TEST(Keys, CollisionsCostNoMoreThanASort) {
  Dictionary entries;
  for (int i = 0; i < 20'000; ++i) {
    const std::string number = std::to_string(100'000 + i);
    entries.emplace_back(std::string(10, 'a') + number + std::string(40, 'a'), true);
  }
  EXPECT_EQ(problemIn(writeXml(entries)), std::nullopt);
  entries[1].first = entries[15'000].first;
  EXPECT_EQ(problemIn(writeXml(entries)), Problem::duplicateKey);
}

// 20,000 dictionaries with the same two long keys: 16 GB to compare, if compared in each.
TEST(Keys, LongSharedKeysAreRankedOnce) {
  const auto message = [](char last) {
    constexpr std::size_t dictionaries = 20'000;
    Raw raw{{"\xAF\x12" + bigEndian(dictionaries, 4)}, 2, 4};
    for (std::size_t i = 0; i < dictionaries; ++i) raw.objects[0] += bigEndian(4 + i, 2);
    const std::string text(400'000, 'k');
    raw.objects.push_back("\x5F\x12" + bigEndian(text.size() + 1, 4) + text + 'k');
    raw.objects.push_back("\x5F\x12" + bigEndian(text.size() + 1, 4) + text + last);
    raw.objects.push_back("\x09");
    for (std::size_t i = 0; i < dictionaries; ++i)
      raw.objects.push_back(bytes("\xD2\0\1\0\2\0\3\0\3"));
    return raw.message();
  };
  EXPECT_EQ(problemIn(message('l')), std::nullopt);
  EXPECT_EQ(problemIn(message('k')), Problem::duplicateKey);
}

}  // namespace
}  // namespace PropertyList
