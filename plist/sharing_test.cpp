// SPDX-License-Identifier: Apache-2.0
/// Depth, sharing, overlap and repeated keys: the ways to make a small message expensive.
#include "plist/expansion_budget.h"
#include "plist/key_hash.h"
#include "plist/limits.h"
#include "plist/test_messages.h"
#include "plist/writer.h"

namespace PropertyList {
namespace {

/// In both encodings.
void expectProblem(const Tree& tree, std::optional<Problem> problem, std::size_t at) {
  EXPECT_EQ(problemIn(writeBinary(tree)), problem) << at;
  EXPECT_EQ(problemIn(writeXml(tree)), problem) << at;
}

TEST(Depth, LimitIsExactInXml) {
  // The innermost is empty: such ones count too.
  const auto nested = [](std::size_t depth) {
    std::string text = "<dict/>";
    for (std::size_t i = 1; i < depth; ++i) text += "</array>";
    for (std::size_t i = 1; i < depth; ++i) text.insert(0, "<array>");
    return problemIn(xml(text));
  };
  EXPECT_EQ(nested(512), std::nullopt);
  EXPECT_EQ(nested(513), Problem::tooDeep);
  EXPECT_EQ(nested(100'000), Problem::tooDeep);
}

/// Lists, each of which holds the next, and the last one this object, or nothing.
void appendChain(Raw& raw, std::size_t count, std::size_t last) {
  for (; count > 0; --count) {
    const std::size_t held = count == 1 ? last : raw.objects.size() + 1;
    raw.objects.push_back(held == 0 ? "\xA0" : "\xA1" + bigEndian(held, 2));
  }
}

TEST(Depth, CountsEveryPathThroughSharedContainers) {
  // A tail, and chains of which each ends in what was walked before it.
  const auto joined = [](std::size_t tail, const std::vector<std::size_t>& chains) {
    Raw raw{{std::string(1, static_cast<char>(0xA1 + chains.size())) + bigEndian(1, 2)}, 2, 4};
    appendChain(raw, tail, 0);
    std::size_t last = 1;
    for (const std::size_t length : chains) {
      const std::size_t start = raw.objects.size();
      raw.objects[0] += bigEndian(start, 2);
      appendChain(raw, length, last);
      last = start;
    }
    return problemIn(raw.message());
  };
  EXPECT_EQ(joined(511, {}), std::nullopt);
  EXPECT_EQ(joined(10'000, {}), Problem::tooDeep);
  EXPECT_EQ(joined(211, {300}), std::nullopt);
  EXPECT_EQ(joined(212, {300}), Problem::tooDeep);
  // The middle one has a height only because of what was read before.
  EXPECT_EQ(joined(310, {1, 200}), std::nullopt);
  EXPECT_EQ(joined(311, {1, 200}), Problem::tooDeep);
}

TEST(Sharing, IsInheritedDownwards) {
  //  top: {"a": list, "b": list, "c": own}, list: [{"x": "y"}], own: ["z"]
  const std::string message =
      binary({"\xD3\x01\x02\x03\x04\x04\x05", "\x51\x61", "\x51\x62", "\x51\x63", "\xA1\x06",
              "\xA1\x09", "\xD1\x07\x08", "\x51x", "\x51y", "\x51z"});
  const Document document(bytesOf(message));
  EXPECT_FALSE(document.top().isShared());
  for (const Entry entry : document.top().entries()) {
    const bool isShared = entry.key != "c";
    const Value held = *entry.value.elements().begin();
    EXPECT_EQ(entry.value.isShared(), isShared) << entry.key;
    EXPECT_EQ(held.isShared(), isShared) << entry.key;
    if (!isShared) continue;
    EXPECT_TRUE((*held.entries().begin()).value.isShared());
  }
}

TEST(Sharing, TheBudgetFollowsTheMessage) {
  const std::string message = binary({"\xA2\x01\x01", "\x51x"});
  const Document document(bytesOf(message));
  const Value shared = *document.top().elements().begin();
  const std::size_t allowance = Limits::expansionBase + Limits::expansionFactor * message.size();
  ExpansionBudget budget(message.size());
  budget.spend(document.top(), 10 * allowance);
  budget.spend(shared, allowance - 1);
  budget.spend(shared, 1);
  EXPECT_THROW(budget.spend(shared, 1), MalformedDocument);
}

/// Many object numbers for the same bytes: none is shared, yet each would be converted anew.
TEST(Sharing, OverlappingObjectsAreCharged) {
  const auto overlapping = [](std::size_t copies, std::size_t units, std::size_t unused = 0) {
    const std::string list = "\xAF\x12" + bigEndian(copies, 4);
    std::string objects = "bplist00" + list;
    for (std::size_t i = 1; i <= copies; ++i) objects += bigEndian(i, 2);
    const std::size_t text = objects.size();
    objects += "\x6F\x12" + bigEndian(units, 4) + std::string(2 * units, 'x');
    objects.append(unused, '\0');
    const std::size_t table = objects.size();
    objects += bigEndian(8, 4);
    for (std::size_t i = 1; i <= copies; ++i) objects += bigEndian(text, 4);
    return objects + Raw{std::vector<std::string>(copies + 1), 2, 4}.trailer(table);
  };
  EXPECT_EQ(problemIn(overlapping(2, 10)), std::nullopt);
  // To the byte: the references, and two bytes for each unit. What nobody names makes the message
  // longer and claims nothing.
  const std::size_t claimed = 10 * (2 + 2 * 20'000);
  const std::size_t needed = (claimed - Limits::claimedBase) / Limits::claimedFactor;
  const std::size_t length = overlapping(10, 20'000, 0).size();
  EXPECT_EQ(problemIn(overlapping(10, 20'000, needed - length)), std::nullopt);
  EXPECT_EQ(problemIn(overlapping(10, 20'000, needed - length - 1)), Problem::overlappingObjects);
  EXPECT_EQ(problemIn(overlapping(10'000, 50'000)), Problem::overlappingObjects);
}

TEST(Keys, RepetitionIsFoundInDictionariesOfEverySizeAtEveryPlace) {
  for (const std::size_t count : {2u, 3u, 8u, 9u, 17u, 156u, 10'000u}) {
    for (const std::size_t keyLength : {0u, 5u, 30u, 100u}) {
      Dictionary entries;
      for (std::size_t i = 0; i < count; ++i) {
        const std::string number = std::to_string(i * 7919 % 10'007);
        const std::string key = number + std::string(keyLength, 'k') + number;
        entries.emplace_back(key, Dictionary{{key, true}});
      }
      // Equal keys beside and inside are other dictionaries' keys.
      expectProblem(Array{entries, entries}, std::nullopt, count);
      const std::size_t last = count - 1, step = count > 9 ? last : 1;
      for (std::size_t second = step; second < count; second += step) {
        for (std::size_t first = step / 2; first < second; first += step) {
          Dictionary changed = entries;
          changed[second].first = changed[first].first;
          expectProblem(changed, Problem::duplicateKey, 100 * first + second);
        }
      }
    }
  }
}

TEST(Keys, AreComparedByMeaning) {
  EXPECT_EQ(
      problemIn(binary({"\xD2\x01\x02\x03\x03", "\x52\x61\x62", bytes("\x62\0a\0b"), "\x09"})),
      Problem::duplicateKey);
  EXPECT_EQ(problemIn(binary({"\xD2\x01\x01\x02\x02", "\x51\x61", "\x09"})), Problem::duplicateKey);
  // Of two that are the same the second is told, also where another dictionary has had it before.
  const std::string repeated =
      binary({"\xA2\x01\x02", "\xD1\x03\x05", "\xD3\x04\x06\x03\x05\x05\x05", "\x53zzz", "\x53zzz",
              "\x09", "\x53yyy"});
  try {
    const Document document(bytesOf(repeated));
    ADD_FAILURE();
  } catch (const MalformedDocument& error) {
    EXPECT_EQ(error.offset(), repeated.find('\xD3') + 3);
  }
  // The first fault of a dictionary is told: not the key behind it that is not a text.
  EXPECT_EQ(problemIn(binary({"\xD3\x01\x01\x02\x02\x02\x02", "\x51\x61", "\x09"})),
            Problem::duplicateKey);
  EXPECT_EQ(problemIn(xml("<dict><key>a&lt;</key><true/><key><![CDATA[a<]]></key><true/></dict>")),
            Problem::duplicateKey);
  EXPECT_EQ(problemIn(xml("<dict><key>a</key><dict><key>a</key><true/></dict></dict>")),
            std::nullopt);
}

TEST(Keys, WithOneHashAreToldApart) {
  const std::vector<std::string> keys = keysOfOneHash(2'000);
  ASSERT_EQ(keyHash(keyDigest(keys.front()), 32), keyHash(keyDigest(keys.back()), 32));
  Dictionary entries;
  // Honest ones among them, so that the table grows while there are collisions.
  for (std::size_t i = 0; i < keys.size(); ++i) {
    entries.emplace_back(keys[i], Dictionary{{"honest " + std::to_string(i), true}});
  }
  EXPECT_EQ(problemIn(writeBinary(entries)), std::nullopt);
  EXPECT_EQ(problemIn(writeXml(Array{entries, entries})), std::nullopt);
  // In XML equal keys are never one object.
  for (const auto& [first, second] :
       {std::pair(0u, 1'999u), {4u, 20u}, {600u, 602u}, {1'997u, 1'998u}}) {
    const std::string kept = std::exchange(entries[second].first, entries[first].first);
    EXPECT_EQ(problemIn(writeXml(entries)), Problem::duplicateKey) << second;
    // Known from another dictionary, of keys that have found no place, too.
    EXPECT_EQ(
        problemIn(writeXml(Array{Dictionary(entries.begin(), entries.begin() + second), entries})),
        Problem::duplicateKey)
        << second;
    entries[second].first = kept;
  }
}

}  // namespace
}  // namespace PropertyList
