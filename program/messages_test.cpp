// SPDX-License-Identifier: Apache-2.0
// What each kind of message gives, and which error, in tables. Every row runs in both encodings.
#include "plist/test_messages.h"
#include "program/schema/mirror_encoding.h"
#include "program/schema/property_list_decoder.h"
#include "program/service/tables.h"
#include "program/test_support.h"

#include <gtest/gtest.h>

#include <limits>

namespace VespKeelgateService::Testing {

namespace {

using PropertyList::Array;
using PropertyList::Dictionary;
using PropertyList::Tree;

TEST(Sessions, TheCommandAloneSelectsTheSchema) {
  const Dictionary offer{{"t", 1}, {"v", 2}, {"p", "P"}, {"d", true}, {"s", "S"}};
  const Dictionary triple{{"v", 1}, {"s", "S"}, {"p", "P"}};
  const std::string cancelled =
      ".result.sessionCancel.version=1 .result.sessionCancel.sessionID=S "
      ".result.sessionCancel.participantID=P";
  check({
      {"an offer sent as an accept",
       {video, 233},
       offer,
       ".result.sessionAccept.version=2 .result.sessionAccept.sessionID=S "
       ".result.sessionAccept.participantID=P"},
      {"least cancel", {audio, 235}, triple, cancelled},
      {"known end reason",
       {audio, 235},
       with({{"e", 4}}, triple),
       cancelled + " .result.sessionCancel.remoteEndReason=4"},
      {"unknown end reason", {audio, 235}, with({{"e", 77}}, triple), "dataCorrupted @e"},
      {"negative end reason", {audio, 235}, with({{"e", -1}}, triple), "dataCorrupted @e"},
      {"end reason as text", {audio, 235}, with({{"e", "4"}}, triple), "typeMismatch @e"},
      {"decline sent as reinitiate", {video, 238}, triple, "keyNotFound ri @"},
      {"unknown subcommand", {video, 238}, with({{"ri", 99}}, triple), "dataCorrupted @ri"},
      {"unknown transport", {video, 232}, with({{"t", 99}}, offer), "dataCorrupted @t"},
      {"negative version", {video, 232}, with({{"v", -1}}, offer), "dataCorrupted @v"},
      {"an offer without d",
       {video, 232},
       Dictionary{{"t", 1}, {"v", 2}, {"p", "P"}, {"s", "S"}},
       "keyNotFound d @"},
      {"negative version of an accept",
       {video, 233},
       with({{"v", -1}}, triple),
       "dataCorrupted @v"},
      {"empty octets are not absent",
       {video, 234},
       with({{"c", data("")}}, triple),
       ".result.sessionDecline.version=1 .result.sessionDecline.sessionID=S "
       ".result.sessionDecline.participantID=P .result.sessionDecline.sessionMessageContext="},
  });
}

TEST(Payloads, AreStrictAtEveryDepth) {
  check({
      {"least", payload, Dictionary{{"c", 1}}, ".command=1"},
      {"no command", payload, Dictionary{{"v", 1}}, "keyNotFound c @"},
      {"text where the answers have a number", payload, Dictionary{{"c", 1}, {"i", 5}},
       "typeMismatch @i"},
      {"gdr is no boolean", payload, Dictionary{{"c", 1}, {"gdr", true}}, "typeMismatch @gdr"},
      {"ack is no boolean", payload, Dictionary{{"c", 1}, {"ack", true}}, "typeMismatch @ack"},
      {"second inner payload without command", payload,
       Dictionary{{"c", 1}, {"mml", Array{Dictionary{{"c", 1}}, Dictionary{}}}},
       "keyNotFound c @mml.1"},
      {"deep in the headers", payload,
       Dictionary{{"c", 1},
                  {"mml", Array{Dictionary{{"c", 1}},
                                Dictionary{{"c", 1}, {"h", Dictionary{{"ri", 1}}}}}}},
       "typeMismatch @mml.1.h.ri"},
      {"keys differ by case", payload,
       Dictionary{{"c", 1}, {"ri", "text"}, {"rI", data("octets")}, {"h", Dictionary{}}, {"H", 9}},
       ".command=1 .storageFlags=9 .responseIdentifier=octets .responseIdentifierString=text "
       ".httpHeaders={}"},
      {"headers by their names", payload, Dictionary{{"c", 1}, {"h", Dictionary{{"traceId", "t"}}}},
       ".command=1 .httpHeaders={}"},
      {"negative participant", payload,
       Dictionary{{"c", 1}, {"qal", Array{Dictionary{{"hli", -1}}}}}, "dataCorrupted @qal.0.hli"},
      {"message number as text", response, Dictionary{{"c", 1}, {"i", "5"}}, "typeMismatch @i"},
      {"hlss as a number", response, Dictionary{{"c", 1}, {"hlss", 1}}, "typeMismatch @hlss"},
      {"no headers", tunnel, Dictionary{{"c", 1}}, ".command=1"},
      {"empty headers", tunnel, Dictionary{{"c", 1}, {"h", Dictionary{}}},
       ".command=1 .httpHeaders={}"},
      {"beyond 64 signed bits", tunnel,
       Dictionary{{"c", 1}, {"e", std::numeric_limits<std::uint64_t>::max()}}, "dataCorrupted @e"},
  });
}

TEST(Payloads, NestAsDeepAsPropertyListsDo) {
  const auto nested = [](int payloads) {
    Tree tree = Dictionary{{"c", payloads}};
    for (int n = payloads - 1; n > 0; --n) {
      tree = Dictionary{{"c", n}, {n % 2 == 0 ? "mml" : "dtl", Array{std::move(tree)}}};
    }
    return outcome(payload, tree);
  };
  // Each payload but the innermost is a dictionary and an array: 511 containers.
  EXPECT_TRUE(nested(256).ends_with(".command=256")) << nested(256).substr(0, 200);
  EXPECT_EQ(nested(257), "dataCorrupted @");
}

std::string outcomeOfRaw(const PropertyList::Raw& raw) {
  const std::string message = raw.message();
  return outcome(payload, PropertyList::bytesOf(message));
}

TEST(Payloads, SharedOnesAreRefusedBeforeMemoryGrows) {
  // A list of two references to the next list, thirty levels deep, would be 2^30 payloads. Nobody
  // reads it under an unknown key, and there it is an ordinary message.
  const auto doubling = [](const std::string& key) {
    PropertyList::Raw raw;
    constexpr char levels = 30;
    constexpr char command = 2 * levels + 1;
    constexpr char one = command + 1;
    constexpr char list = one + 1;
    for (char next = 1; next < command; next = static_cast<char>(next + 2)) {
      const auto after = static_cast<char>(next + 1);
      raw.objects.push_back({'\xd2', command, list, one, next});
      raw.objects.push_back({'\xa2', after, after});
    }
    raw.objects.push_back({'\xd1', command, one});
    raw.objects.insert(raw.objects.end(), {{'\x51', 'c'}, {'\x10', '\1'}, '\x53' + key});
    return outcomeOfRaw(raw);
  };
  EXPECT_EQ(doubling("mml"), "dataCorrupted @");
  EXPECT_EQ(doubling("zzz"), ".command=1");
}

TEST(Payloads, SharedOnesAreRefusedBeforeTheirUnknownKeysTakeTime) {
  // A hundred references to one payload are cheap to make, but not to look through when it has a
  // thousand keys that no field takes: the square of the message's length.
  const auto wide = [](const std::string& key, std::uint64_t width) {
    const auto two = [](std::uint64_t number) {
      return PropertyList::bigEndian(number, 2);
    };
    PropertyList::Raw raw{{"\xd2" + two(1) + two(2) + two(3) + two(4),
                           "\x51"
                           "c",
                           '\x53' + key, "\x10\x01", "\xaf\x10\x64", "\xdf\x11" + two(width + 1)},
                          2};
    for (int i = 0; i < 100; ++i) raw.objects[4] += two(5);
    std::string values = two(3);
    raw.objects[5] += two(1);
    for (std::uint64_t i = 0; i < width; ++i) {
      raw.objects[5] += two(raw.objects.size());
      raw.objects.push_back("\x54" + std::to_string(1000 + i));
      values += two(3);
    }
    raw.objects[5] += values;
    return outcomeOfRaw(raw);
  };
  EXPECT_EQ(wide("mml", 1000), "dataCorrupted @");
  EXPECT_EQ(wide("zzz", 1000), ".command=1");
  EXPECT_TRUE(wide("mml", 20).ends_with("[99].command=1")) << wide("mml", 20);
}

TEST(Payloads, LargeOnesAreOrdinary) {
  Dictionary large{{"c", 1}, {"P", PropertyList::Data(4u << 20, std::byte{7})}};
  for (int i = 0; i < 10'000; ++i) large.emplace_back("unknown-" + std::to_string(i), i);
  const std::string got = outcome(payload, large);
  EXPECT_EQ(got.size(), std::string(".command=1 .payload=").size() + (4u << 20));
}

TEST(Invitations, FailInTheOrderOfTheirFields) {
  const auto envelope = [](Dictionary context) {
    return Dictionary{{"c", std::move(context)}, {"s", -5}, {"uID", "u"}};
  };
  const Dictionary vitals{{"cS", "1"}, {"cT", 1}, {"cD", Dictionary{{"ObjectDataKey", data("x")}}}};
  const auto unknown = [](const std::string& schema) {
    return "breach com.tessen.Keelgate.VespKeelgateService: Unknown invitation schema: (" + schema +
           ")";
  };
  const auto kind = [&](const char* schema, Tree contents) {
    return envelope(Dictionary{{"cS", schema}, {"cT", 1}, {"cD", std::move(contents)}});
  };
  const Dictionary coffer{
      {"groupID", "g"}, {"shareURL", "u"}, {"invitationToken", data("t")}, {"inviteeHandle", "h"}};
  const char* const cofferSchema = "com.tessen.coffersharingmessagingd";
  const std::string token = "breach com.tessen.Keelgate.SkyvaultSharingToken: ";
  check({
      {"vitals", invitation, envelope(vitals),
       ".context.schema=1 .context.contextType=1 "
       ".context.context.dictionary.vespVitalsInvitation.untrustedData=x .state=-5 "
       ".identifier=u"},
      {"another context type", invitation, envelope(with({{"cT", 2}}, vitals)),
       "dataCorrupted @c.cT"},
      {"context type before schema", invitation, envelope(Dictionary{{"cS", "x"}, {"cT", 2}}),
       "dataCorrupted @c.cT"},
      {"schema before data", invitation, envelope(Dictionary{{"cS", "x"}, {"cT", 1}}),
       unknown("x")},
      {"near miss", invitation, kind("ht-invite-v2", Dictionary{}), unknown("ht-invite-v2")},
      {"letter case", invitation, kind("Stride-sharing-invite", Dictionary{}),
       unknown("Stride-sharing-invite")},
      {"no data", invitation, envelope(Dictionary{{"cS", "1"}, {"cT", 1}}), "keyNotFound cD @c"},
      {"context before state", invitation, Dictionary{{"c", Dictionary{}}}, "keyNotFound cS @c"},
      {"no state", invitation, Dictionary{{"c", vitals}, {"uID", "u"}}, "keyNotFound s @"},
      {"data of another type", invitation, kind("1", "text"), "typeMismatch @c.cD"},
      {"text for octets", invitation, kind("1", Dictionary{{"ObjectDataKey", "x"}}),
       "typeMismatch @c.cD.ObjectDataKey"},
      {"stride without payload", invitation, kind("stride-sharing-invite", Dictionary{{"item", 1}}),
       "keyNotFound payload @c.cD"},
      {"empty sample", invitation, kind("com.tessen.Vesp.schema.invitation", Dictionary{}),
       ".context.schema=com.tessen.Vesp.schema.invitation .context.contextType=1 "
       ".context.context.dictionary.vespSampleInvitation={} .state=-5 .identifier=u"},
      {"the share URL's type is checked", invitation,
       kind("ht-invite-v1", Dictionary{{"HRDHomeInvitationShareURLKey", 1}}),
       "typeMismatch @c.cD.HRDHomeInvitationShareURLKey"},
      {"half of the capabilities", invitation,
       kind("ht-invite-v1",
            Dictionary{{"kRequestedCapabilitiesKey", Dictionary{{"kHearthdVersionKey", 1.0}}}}),
       "keyNotFound kHearthdSupportedFeaturesKey @c.cD.kRequestedCapabilitiesKey"},
      {"a UUID without dashes", invitation,
       kind("ht-invite-v1", Dictionary{{"kHomeUUID", "0f8fad5bd9cb469fa16570867728950e"}}),
       "dataCorrupted @c.cD.kHomeUUID"},
      {"an empty home token", invitation,
       kind("ht-invite-v1", Dictionary{{"HRDHomeInvitationShareTokenKey", data("")}}),
       token + "Empty sharing token"},
      {"an empty coffer token", invitation,
       kind(cofferSchema, with({{"invitationToken", data("")}}, coffer)),
       token + "Empty sharing token"},
      {"an empty share URL", invitation, kind(cofferSchema, with({{"shareURL", ""}}, coffer)),
       token + "Empty share URL"},
      {"the display name's own name is no key", invitation,
       kind(cofferSchema, with({{"displayName", "n"}}, coffer)),
       ".context.schema=com.tessen.coffersharingmessagingd .context.contextType=1 "
       ".context.context.dictionary.vespCofferSharingInvitation.groupID=g "
       ".context.context.dictionary.vespCofferSharingInvitation.invitationToken.tokenData=t "
       ".context.context.dictionary.vespCofferSharingInvitation.inviteeHandle=h .state=-5 "
       ".identifier=u"},
  });
}

TEST(Invitations, TheMirrorOfAContextIsCaseKeyedAndDoesNotComeBack) {
  const auto mirrored = [](VespDictionaryContextClientSchema kind, const char* schema) {
    return mirror(
        VespInvitationSchema{.context = {.schema = schema,
                                         .contextType = VespInvitationContextType::dictionary,
                                         .contextData = std::move(kind)},
                             .state = 1,
                             .expiration = {},
                             .identifier = "u"});
  };
  const Tree stride =
      mirrored(VespStrideSharingInvitationSchema{.protobufItem = 3, .protobufPayload = {}},
               "stride-sharing-invite");
  const Tree form = Dictionary{
      {"dictionaryContext",
       Dictionary{{"_0", Dictionary{{"vespStrideSharingInvitation",
                                     Dictionary{{"_0", Dictionary{{"item", 3},
                                                                  {"payload", data("")}}}}}}}}}};
  EXPECT_EQ(stride, Tree(Dictionary{
                        {"c", Dictionary{{"cS", "stride-sharing-invite"}, {"cT", 1}, {"cD", form}}},
                        {"s", 1},
                        {"uID", "u"}}));
  EXPECT_EQ(outcome(invitation, stride), "keyNotFound item @c.cD");
  const Tree home = mirrored(VespHearthInvitationSchema{}, "ht-invite-v1");
  EXPECT_NE(outcome(invitation, home).find("vespHearthInvitation={}"), std::string::npos);
}

TEST(Invitations, TheStandardDecodersOfTheCaseKeyedFormWantExactlyOneKey) {
  const auto decoded = [](const Tree& tree) {
    struct Holder {
      static std::string decode(const Tree& from) {
        const auto bytes = PropertyList::writeBinary(from);
        const PropertyList::Document document(bytes);
        PropertyList::ExpansionBudget budget(bytes.size());
        Decoding decoding{budget};
        VespDictionaryContextData contextData;
        return errorOf([&] {
          try {
            decodeValue(decoding, document.top(), CodingPath(), contextData);
          } catch (const Keelgate::DecodingError& error) {
            if (error.debugDescription == "Invalid number of keys found, expected one.") {
              throw Keelgate::Breach("not one key", std::to_string(error.codingPath.size()));
            }
            throw;
          }
        });
      }
    };
    return Holder::decode(tree);
  };
  const auto form = [](Dictionary kind) {
    return Dictionary{{"dictionaryContext", Dictionary{{"_0", std::move(kind)}}}};
  };
  const Dictionary body{{"_0", Dictionary{}}};
  EXPECT_EQ(decoded(form({{"vespSampleInvitation", body}})), "");
  EXPECT_EQ(decoded(Dictionary{}), "breach not one key: 0");
  EXPECT_EQ(decoded(form({})), "breach not one key: 2");
  EXPECT_EQ(decoded(form({{"vespSampleInvitation", body}, {"vespHearthInvitation", body}})),
            "breach not one key: 2");
  EXPECT_EQ(decoded(form({{"vespSampleInvitation", Dictionary{}}})),
            "keyNotFound _0 @dictionaryContext._0.vespSampleInvitation");
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
  std::string groups;
  for (int n = 2; n <= 32; ++n) {
    groups += " .result.waymarkMessage.groupFields[" + std::to_string(n - 2) +
              "].groupNumber=" + std::to_string(n);
  }
  const std::string plain = unpacked({});
  EXPECT_TRUE(plain.ends_with(groups)) << plain;
  EXPECT_EQ(unpacked({{"receiverHandle1", "x"}, {"receiverHandle33", 5}, {"shareURL02", "x"}}),
            plain);
  EXPECT_NE(unpacked({{"messageType", 12345}}).find("messageType=0"), std::string::npos);
  EXPECT_EQ(plain.find("triggerType"), std::string::npos) << "absent is not the default";
  EXPECT_NE(unpacked({{"triggerType", 12345}}).find("triggerType=0"), std::string::npos);
  EXPECT_EQ(unpacked({{"triggerType", -1}}), "dataCorrupted @triggerType");
  EXPECT_EQ(unpacked({{"isSOSTrigger", 1}}), "typeMismatch @isSOSTrigger");
  EXPECT_EQ(unpacked({{"latitude", "48"}}), "typeMismatch @latitude");
}

}  // namespace

}  // namespace VespKeelgateService::Testing
