// SPDX-License-Identifier: Apache-2.0
// Any property list comes out as the tree that went in.
#include "plist/test_messages.h"
#include "program/property_list/property_list_unpacker.h"
#include "program/test_support.h"

#include <gtest/gtest.h>

#include <limits>
#include <random>

namespace VespKeelgateService::Testing {

namespace {

using Keelgate::PropertyListEntry;
using Keelgate::PropertyListSet;
using Keelgate::PropertyListUID;
using Keelgate::PropertyListValue;
using ::PropertyList::Tree;

Tree treeOf(const PropertyListValue& value);

::PropertyList::Array treesOf(const Keelgate::Array<PropertyListValue>& values) {
  ::PropertyList::Array trees;
  for (const PropertyListValue& value : values) trees.push_back(treeOf(value));
  return trees;
}

Tree treeOf(const PropertyListValue& value) {
  return std::visit(
      []<class V>(const V& held) -> Tree {
        if constexpr (std::same_as<V, Keelgate::Date>) {
          return ::PropertyList::Date{held.secondsSinceReferenceDate};
        } else if constexpr (std::same_as<V, PropertyListUID>) {
          EXPECT_EQ(held.high, 0u);
          return ::PropertyList::Uid{held.low};
        } else if constexpr (std::same_as<V, Keelgate::Array<PropertyListValue>>) {
          return treesOf(held);
        } else if constexpr (std::same_as<V, PropertyListSet>) {
          return ::PropertyList::Set{treesOf(held.elements)};
        } else if constexpr (std::same_as<V, Keelgate::Array<PropertyListEntry>>) {
          ::PropertyList::Dictionary dictionary;
          for (const auto& entry : held) dictionary.emplace_back(entry.key, treeOf(entry.value));
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

/// Trees that XML can say, or with `binary` all that a binary property list can.
class RandomTrees {
 public:
  RandomTrees(unsigned seed, bool binary) : random_(seed), binary_(binary) {}

  Tree next(int depth) {
    // Without containers at the bottom.
    const std::size_t kinds = binary_ ? 12 : 8;
    switch (depth > 0 ? below(kinds) : 2 + below(kinds - 3)) {
      case 0: {
        ::PropertyList::Dictionary dictionary;
        for (auto n = below(6); n > 0; --n) {
          dictionary.emplace_back(text() + std::to_string(n), next(depth - 1));
        }
        return dictionary;
      }
      case 1:
        return array(depth);
      case 2:
        return text();
      case 3:
        return ::PropertyList::Data(below(40), static_cast<std::byte>(random_()));
      case 4:
        return static_cast<std::int64_t>(random_() >> (1 + below(63))) * (below(2) == 0 ? 1 : -1);
      case 5:
        return (std::uint64_t{1} << 63) + (random_() >> 1);
      case 6:
        return static_cast<double>(random_()) / 3.0;
      case 7:
        return below(2) == 0;
      case 8:
        return nullptr;
      case 9:
        return ::PropertyList::Date{static_cast<double>(below(1'000'000)) / 8};
      case 10:
        return ::PropertyList::Uid{random_()};
      default:
        return ::PropertyList::Set{array(depth)};
    }
  }

 private:
  std::size_t below(std::size_t limit) { return random_() % limit; }
  std::string text() {
    const char* const texts[] = {"", "a", "\u00e9<&>", "\U0001f600", "no longer a short text"};
    return texts[below(std::size(texts))];
  }
  ::PropertyList::Array array(int depth) {
    ::PropertyList::Array elements;
    for (auto n = below(6); n > 0; --n) elements.push_back(next(depth - 1));
    return elements;
  }

  std::mt19937_64 random_;
  bool binary_;
};

TEST(PropertyLists, ComeOutAsTheTreeThatTheyAreInBothEncodings) {
  for (unsigned seed = 0; seed < 1000; ++seed) {
    const Tree any = RandomTrees(seed, true).next(5);
    EXPECT_EQ(treeOf(unpacked(::PropertyList::writeBinary(any))), any) << seed;
    const Tree plain = RandomTrees(seed, false).next(5);
    const std::string xml = ::PropertyList::writeXml(plain);
    EXPECT_EQ(treeOf(unpacked(::PropertyList::bytesOf(xml))), plain) << xml;
    EXPECT_EQ(unpacked(::PropertyList::writeBinary(plain)), unpacked(::PropertyList::bytesOf(xml)));
  }
}

TEST(PropertyLists, KeepUidsOf128BitsAndIntegersOfEitherSign) {
  const auto only = [](const std::string& object) {
    return unpacked(::PropertyList::bytesOf(::PropertyList::binary({object})));
  };
  EXPECT_EQ(only("\x8f"
                 "0123456789abcdef"),
            PropertyListValue((PropertyListUID{0x3031323334353637, 0x3839616263646566})));
  EXPECT_EQ(only(::PropertyList::bytes("\x82\x01\x02\x03")),
            PropertyListValue((PropertyListUID{0, 0x010203})));
  EXPECT_EQ(only("\x13\x80" + std::string(7, '\0')),
            PropertyListValue(std::numeric_limits<Keelgate::Int64>::min()));
  EXPECT_EQ(only("\x14" + std::string(8, '\0') + "\x80" + std::string(7, '\0')),
            PropertyListValue(Keelgate::UInt64{1} << 63));
}

TEST(PropertyLists, NestToTheLimitAndNoFurther) {
  const auto nested = [](std::size_t containers) {
    Tree tree = ::PropertyList::Array{};
    for (std::size_t n = 1; n < containers; ++n) {
      tree = n % 2 == 0 ? Tree(::PropertyList::Array{std::move(tree)})
                        : Tree(::PropertyList::Dictionary{{"k", std::move(tree)}});
    }
    return tree;
  };
  EXPECT_EQ(treeOf(unpacked(::PropertyList::writeBinary(nested(512)))), nested(512));
  EXPECT_EQ(errorOf([&] { unpacked(::PropertyList::writeBinary(nested(513))); }),
            "dataCorrupted @");
  EXPECT_EQ(errorOf([&] { unpacked({}); }), "dataCorrupted @");
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
  const std::string text =
      "\x5f\x12" + ::PropertyList::bigEndian(60'000, 4) + std::string(60'000, 'x');
  const auto bytes = ::PropertyList::bytes("\xa1\x00\x01");
  EXPECT_EQ(shared(text, bytes, 10), "");
  EXPECT_EQ(shared(text, bytes, 1000), "dataCorrupted @");
  EXPECT_EQ(shared(text, ::PropertyList::bytes("\xd1\x00\x01\x00\x02"), 10), "");
  EXPECT_EQ(shared(text, ::PropertyList::bytes("\xd1\x00\x01\x00\x02"), 1000), "dataCorrupted @");

  std::vector<std::string> doubling;
  for (char i = 1; i < 60; ++i) doubling.push_back({'\xa2', i, i});
  doubling.emplace_back("\xa0");
  const std::string message = ::PropertyList::binary(doubling);
  EXPECT_EQ(errorOf([&] { unpacked(::PropertyList::bytesOf(message)); }), "dataCorrupted @");
}

}  // namespace

}  // namespace VespKeelgateService::Testing
