// SPDX-License-Identifier: Apache-2.0
// What single kinds of message have of their own. What plain messages give, and which error, the
// files of tests/examples say.
#include "framework/transport/wire.h"
#include "plist/limits.h"
#include "plist/test_messages.h"
#include "program/property_list/property_list_unpacker.h"
#include "program/schema/mirror_encoding.h"
#include "program/schema/property_list_decoder.h"
#include "program/service/tables.h"
#include "program/test_support.h"

#include <gtest/gtest.h>

namespace VespKeelgateService::Testing {

// What the service can read the client can read back.
static_assert(Keelgate::Transport::maximumNesting == PropertyList::Limits::nestedContainers);

namespace {

using PropertyList::Array;
using PropertyList::Dictionary;
using PropertyList::Tree;

TEST(Payloads, SharedOnesAreRefusedBeforeTheyTakeMemoryOrTime) {
  // Many references to one payload are cheap to make. Each would be a record of 156 fields; and one
  // with a thousand keys that no field takes would be looked through each time: the square of the
  // message's length. Nobody reads them under an unknown key, and there they are ordinary.
  const auto shared = [](const std::string& key, std::size_t references, std::size_t keys) {
    using PropertyList::bigEndian;
    PropertyList::Raw raw{{PropertyList::bytes("\xd2\0\1\0\2\0\3\0\4"),
                           {'\x51', 'c'},
                           '\x53' + key,
                           "\x10\x01",
                           "\xaf\x11" + bigEndian(references, 2),
                           "\xdf\x11" + bigEndian(keys + 1, 2)},
                          2};
    for (std::size_t i = 0; i < references; ++i) raw.objects[4] += bigEndian(5, 2);
    std::string values = bigEndian(3, 2);
    raw.objects[5] += bigEndian(1, 2);
    for (std::size_t i = 0; i < keys; ++i) {
      raw.objects[5] += bigEndian(raw.objects.size(), 2);
      raw.objects.push_back("\x54" + std::to_string(1000 + i));
      values += bigEndian(3, 2);
    }
    raw.objects[5] += values;
    const std::string message = raw.message();
    return outcome(payload, PropertyList::bytesOf(message));
  };
  EXPECT_EQ(shared("mml", 60'000, 0), "dataCorrupted @");
  EXPECT_EQ(shared("mml", 100, 1000), "dataCorrupted @");
  EXPECT_EQ(shared("zzz", 60'000, 1000), ".command=1");
  EXPECT_TRUE(shared("mml", 100, 20).ends_with("[99].command=1"));
}

TEST(PropertyLists, ComeOutAsTheTreesThatTheyAre) {
  using Value = Keelgate::PropertyListValue;
  using Values = Keelgate::Array<Value>;
  using Entries = Keelgate::Array<Keelgate::PropertyListEntry>;
  const auto unpacked = [](Keelgate::Bytes message) {
    return PropertyListUnpacker().unpack(message).value;
  };
  constexpr std::uint64_t large = std::uint64_t{1} << 63;
  const Tree tree = Dictionary{{"z", Array{true, -1, large - 1, large, 2.5, PropertyList::Date{5}}},
                               {"a", Dictionary{{"b", "c"}, {"", data("d")}}}};
  const Value value =
      Entries{{"z", Values{true, Keelgate::Int64{-1}, Keelgate::Int64{large - 1},
                           Keelgate::UInt64{large}, 2.5, Keelgate::Date{5}}},
              {"a", Entries{{"b", Keelgate::String("c")}, {"", Keelgate::Data{std::byte{'d'}}}}}};
  EXPECT_EQ(unpacked(PropertyList::writeBinary(tree)), value);
  EXPECT_EQ(unpacked(PropertyList::bytesOf(PropertyList::writeXml(tree))), value);
  // Which XML has not.
  const std::string set = PropertyList::binary(
      {"\xc2\x01\x02", PropertyList::bytes("\0"), "\x8f" + std::string("0123456789abcdef")});
  EXPECT_EQ(unpacked(PropertyList::bytesOf(set)),
            Value(Keelgate::PropertyListSet{
                {nullptr, Keelgate::PropertyListUID{0x3031323334353637, 0x3839616263646566}}}));
}

TEST(PropertyLists, SharedObjectsAreRefusedBeforeTheyTakeMemory) {
  // One long text, as a value or as a key, and a level of containers that doubles at each step.
  const auto shared = [](const std::string& object, const std::string& marker,
                         std::size_t references) {
    using PropertyList::bigEndian;
    PropertyList::Raw raw{{"\xaf\x11" + bigEndian(references, 2), object, "\x08"}, 2};
    for (std::size_t i = 0; i < references; ++i) {
      raw.objects[0] += bigEndian(raw.objects.size(), 2);
      raw.objects.push_back(marker);
    }
    const std::string message = raw.message();
    return errorOf([&] { PropertyListUnpacker().unpack(PropertyList::bytesOf(message)); });
  };
  constexpr std::size_t length = 60'000;
  const std::string text =
      "\x5f\x12" + PropertyList::bigEndian(length, 4) + std::string(length, 'x');
  // What is made counts twice, since it is written into the reply too.
  namespace Limits = PropertyList::Limits;
  const std::size_t allowed =
      (Limits::expansionBase + Limits::expansionFactor * text.size()) / (2 * length);
  for (const std::string& marker :
       {PropertyList::bytes("\xa1\x00\x01"), PropertyList::bytes("\xd1\x00\x01\x00\x02")}) {
    EXPECT_EQ(shared(text, marker, allowed * 4 / 5), "");
    EXPECT_EQ(shared(text, marker, allowed * 6 / 5), "dataCorrupted @");
  }

  std::vector<std::string> doubling;
  for (char i = 1; i < 60; ++i) doubling.push_back({'\xa2', i, i});
  doubling.emplace_back("\xa0");
  const std::string message = PropertyList::binary(doubling);
  EXPECT_EQ(errorOf([&] { PropertyListUnpacker().unpack(PropertyList::bytesOf(message)); }),
            "dataCorrupted @");
}

TEST(Invitations, TheMirrorOfAContextIsCaseKeyedAndDoesNotComeBack) {
  const char* const schema = "stride-sharing-invite";
  const Tree stride =
      mirror(VespInvitationSchema{.context = {.schema = schema,
                                              .contextType = VespInvitationContextType::dictionary,
                                              .contextData = {VespStrideSharingInvitationSchema{
                                                  .protobufItem = 3, .protobufPayload = {}}}},
                                  .state = 1,
                                  .expiration = {},
                                  .identifier = "u"});
  const Tree form = Dictionary{
      {"dictionaryContext",
       Dictionary{{"_0", Dictionary{{"vespStrideSharingInvitation",
                                     Dictionary{{"_0", Dictionary{{"item", 3},
                                                                  {"payload", data("")}}}}}}}}}};
  EXPECT_EQ(stride, Tree(Dictionary{{"c", Dictionary{{"cS", schema}, {"cT", 1}, {"cD", form}}},
                                    {"s", 1},
                                    {"uID", "u"}}));
  EXPECT_EQ(outcome(invitation, stride), "keyNotFound item @c.cD");
}

TEST(Invitations, TheStandardDecodersOfTheCaseKeyedFormWantExactlyOneKey) {
  const Dictionary body{{"_0", Dictionary{}}};
  const std::string mismatch = "typeMismatch @dictionaryContext._0";
  const auto form = [](Dictionary kind) {
    return Dictionary{{"dictionaryContext", Dictionary{{"_0", std::move(kind)}}}};
  };
  const std::pair<Dictionary, std::string> rows[] = {
      {form({{"vespSampleInvitation", body}}), ""},
      {{}, "typeMismatch @"},
      {form({}), mismatch},
      {form({{"vespSampleInvitation", body}, {"vespHearthInvitation", body}}), mismatch},
      {form({{"vespOtherInvitation", body}}), mismatch},
      {form({{"vespSampleInvitation", Dictionary{}}}),
       "keyNotFound _0 @dictionaryContext._0.vespSampleInvitation"}};
  for (const auto& [tree, expected] : rows) {
    const auto bytes = PropertyList::writeBinary(tree);
    const PropertyList::Document document(bytes);
    PropertyList::ExpansionBudget budget(bytes.size());
    Decoding decoding{budget};
    VespDictionaryContextData contextData;
    EXPECT_EQ(errorOf([&] {
                decodeValue<VespDictionaryContextData>(decoding, document.top(), CodingPath(),
                                                       contextData);
              }),
              expected);
  }
}

TEST(CheckIns, FoldTheirGroupsAndTolerateUnknownCodes) {
  const Dictionary least{{"messageType", 2},
                         {"interfaceVersion", 1},
                         {"sendDate", 5.5},
                         {"messageID", "m"},
                         {"sessionID", "s"}};
  const auto unpacked = [&](Dictionary changes) {
    return outcome(checkIn, with(std::move(changes), least));
  };
  const std::string plain = unpacked({});
  EXPECT_EQ(unpacked({{"receiverHandle1", "x"}, {"receiverHandle33", 5}, {"shareURL02", "x"}}),
            plain);
  EXPECT_NE(plain.find("messageType=2"), std::string::npos) << "a known code stays";
  EXPECT_EQ(unpacked({{"triggerType", -1}}), "dataCorrupted @triggerType");
  EXPECT_EQ(unpacked({{"isSOSTrigger", 1}}), "typeMismatch @isSOSTrigger");
}

}  // namespace

}  // namespace VespKeelgateService::Testing
