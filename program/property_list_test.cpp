// SPDX-License-Identifier: Apache-2.0
// A property list comes out as the tree that it is, for no more than its length is worth.
#include "framework/transport/wire.h"
#include "plist/limits.h"
#include "plist/test_messages.h"
#include "program/property_list/property_list_unpacker.h"
#include "program/test_support.h"

#include <gtest/gtest.h>

namespace VespKeelgateService::Testing {

// What the service can read the client can read back.
static_assert(Keelgate::Transport::maximumNesting == PropertyList::Limits::nestedContainers);

namespace {

using Keelgate::PropertyListEntry;
using Keelgate::PropertyListSet;
using Keelgate::PropertyListUID;
using Keelgate::PropertyListValue;
using ::PropertyList::Tree;

PropertyListValue unpacked(Keelgate::Bytes message) {
  return PropertyListUnpacker().unpack(message).value;
}

TEST(PropertyLists, ComeOutAsTheTreesThatTheyAre) {
  using Values = Keelgate::Array<PropertyListValue>;
  using Entries = Keelgate::Array<PropertyListEntry>;
  constexpr std::uint64_t large = std::uint64_t{1} << 63;
  const Tree tree = ::PropertyList::Dictionary{
      {"z", ::PropertyList::Array{true, -1, large - 1, large, 2.5, ::PropertyList::Date{5}}},
      {"a", ::PropertyList::Dictionary{{"b", "c"}, {"", data("d")}}}};
  const PropertyListValue value =
      Entries{{"z", Values{true, Keelgate::Int64{-1}, Keelgate::Int64{large - 1},
                           Keelgate::UInt64{large}, 2.5, Keelgate::Date{5}}},
              {"a", Entries{{"b", Keelgate::String("c")}, {"", Keelgate::Data{std::byte{'d'}}}}}};
  EXPECT_EQ(unpacked(::PropertyList::writeBinary(tree)), value);
  EXPECT_EQ(unpacked(::PropertyList::bytesOf(::PropertyList::writeXml(tree))), value);

  // Which XML has not.
  const std::string uid = "\x8f" + std::string("0123456789abcdef");
  EXPECT_EQ(unpacked(::PropertyList::bytesOf(
                ::PropertyList::binary({"\xc2\x01\x02", ::PropertyList::bytes("\0"), uid}))),
            PropertyListValue(PropertyListSet{
                {nullptr, PropertyListUID{0x3031323334353637, 0x3839616263646566}}}));
}

TEST(PropertyLists, SharedObjectsAreRefusedBeforeTheyTakeMemory) {
  // One long text, as a value or as a key, and a level of containers that doubles at each step.
  const auto shared = [](const std::string& object, const std::string& marker,
                         std::size_t references) {
    using ::PropertyList::bigEndian;
    ::PropertyList::Raw raw{{"\xaf\x11" + bigEndian(references, 2), object, "\x08"}, 2};
    for (std::size_t i = 0; i < references; ++i) {
      raw.objects[0] += bigEndian(raw.objects.size(), 2);
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
