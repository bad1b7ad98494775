// SPDX-License-Identifier: Apache-2.0
// Any property list comes out as the tree that went in.
#include "plist/limits.h"
#include "plist/test_messages.h"
#include "program/property_list/property_list_unpacker.h"
#include "program/test_support.h"
#include "tests/filler.h"

#include <gtest/gtest.h>

#include <stdexcept>

namespace VespKeelgateService::Testing {

namespace {

using Keelgate::PropertyListEntry;
using Keelgate::PropertyListSet;
using Keelgate::PropertyListUID;
using Keelgate::PropertyListValue;
using ::PropertyList::Tree;

/// The same as a tree. What fills a value knows nothing of these two rules: an unsigned integer is
/// one that has no other type, and half of a UID is all that a tree holds.
Tree treeOf(PropertyListValue& value) {
  const auto trees = [](auto& values) {
    ::PropertyList::Array all;
    for (PropertyListValue& element : values) all.push_back(treeOf(element));
    return all;
  };
  return std::visit(
      [&]<class V>(V& held) -> Tree {
        if constexpr (std::same_as<V, Keelgate::Date>) {
          return ::PropertyList::Date{held.secondsSinceReferenceDate};
        } else if constexpr (std::same_as<V, Keelgate::UInt64>) {
          return held |= std::uint64_t{1} << 63;
        } else if constexpr (std::same_as<V, PropertyListUID>) {
          held.high = 0;
          return ::PropertyList::Uid{held.low};
        } else if constexpr (std::same_as<V, Keelgate::Array<PropertyListValue>>) {
          return trees(held);
        } else if constexpr (std::same_as<V, PropertyListSet>) {
          return ::PropertyList::Set{trees(held.elements)};
        } else if constexpr (std::same_as<V, Keelgate::Array<PropertyListEntry>>) {
          ::PropertyList::Dictionary dictionary;
          for (auto& entry : held) dictionary.emplace_back(entry.key, treeOf(entry.value));
          return dictionary;
        } else {
          return held;
        }
      },
      value);
}

PropertyListValue unpacked(Keelgate::Bytes message) {
  return PropertyListUnpacker().unpack(message).value;
}

TEST(PropertyLists, ComeOutAsTheTreeThatTheyAreInBothEncodings) {
  std::size_t inBoth = 0;
  for (int start = 0; start < 200; ++start) {
    PropertyListValue value;
    Keelgate::Testing::Filler(start % 7, 4, start).fill(value);
    const Tree tree = treeOf(value);
    EXPECT_EQ(unpacked(::PropertyList::writeBinary(tree)), value) << start;
    try {
      const std::string xml = ::PropertyList::writeXml(tree);
      EXPECT_EQ(unpacked(::PropertyList::bytesOf(xml)), value) << xml;
      ++inBoth;
    } catch (const std::invalid_argument&) {  // XML has no null, UID or set
    }
  }
  EXPECT_GT(inBoth, 50u);
}

TEST(PropertyLists, KeepUidsOf128BitsAndIntegersOfEitherSign) {
  const std::pair<std::string, PropertyListValue> rows[] = {
      {"\x8f" + std::string("0123456789abcdef"),
       PropertyListUID{0x3031323334353637, 0x3839616263646566}},
      {"\x13" + std::string(8, '\xff'), Keelgate::Int64{-1}}};
  for (const auto& [object, value] : rows) {
    EXPECT_EQ(unpacked(::PropertyList::bytesOf(::PropertyList::binary({object}))), value);
  }
}

TEST(PropertyLists, SharedObjectsAreRefusedBeforeTheyTakeMemory) {
  // One long text, as a value or as a key, and a level of containers that doubles at each step.
  const auto shared = [](const std::string& object, const std::string& marker,
                         std::size_t references) {
    const auto two = [](std::size_t number) {
      return ::PropertyList::bigEndian(number, 2);
    };
    ::PropertyList::Raw raw{{"\xaf\x11" + two(references), object, "\x08"}, 2};
    for (std::size_t i = 0; i < references; ++i) {
      raw.objects[0] += two(raw.objects.size());
      raw.objects.push_back(marker);
    }
    const std::string message = raw.message();
    return errorOf([&] { unpacked(::PropertyList::bytesOf(message)); });
  };
  constexpr std::size_t length = 60'000;
  const std::string text =
      "\x5f\x12" + ::PropertyList::bigEndian(length, 4) + std::string(length, 'x');
  // What is made counts twice, since it is written into the reply too.
  namespace Limits = ::PropertyList::Limits;
  const std::size_t allowed =
      (Limits::expansionBase + Limits::expansionFactor * text.size()) / (2 * length);
  for (const std::string& marker :
       {::PropertyList::bytes("\xa1\x00\x01"), ::PropertyList::bytes("\xd1\x00\x01\x00\x02")}) {
    EXPECT_EQ(shared(text, marker, allowed * 4 / 5), "");
    EXPECT_EQ(shared(text, marker, allowed * 6 / 5), "dataCorrupted @");
  }

  std::vector<std::string> doubling;
  for (char i = 1; i < 60; ++i) doubling.push_back({'\xa2', i, i});
  doubling.emplace_back("\xa0");
  const std::string message = ::PropertyList::binary(doubling);
  EXPECT_EQ(errorOf([&] { unpacked(::PropertyList::bytesOf(message)); }), "dataCorrupted @");
}

}  // namespace

}  // namespace VespKeelgateService::Testing
