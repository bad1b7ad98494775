// SPDX-License-Identifier: Apache-2.0
// What all messages share: the rules of keyed decoding, routing, and constructors that refuse.
#include "framework/contracts/log.h"
#include "program/test_support.h"

#include <gtest/gtest.h>

#include <limits>
#include <tuple>

namespace VespKeelgateService::Testing {

namespace {

using PropertyList::Array;
using PropertyList::Dictionary;
using PropertyList::Tree;

const std::string sampleRecord = ".result.vespSampleMessage";
const Dictionary sampleMessage{{"command", 7}, {"client", "a"}};

/// Which XML has not.
TEST(Decoding, TellsNullFromAbsentAndFromValues) {
  const std::tuple<Target, Tree, std::string> rows[] = {
      {sample, with({{"version", nullptr}}, sampleMessage),
       sampleRecord + ".command=7 " + sampleRecord + ".clientName=a"},
      {sample, with({{"client", nullptr}}, sampleMessage), "valueNotFound @client"},
      {sample, nullptr, "typeMismatch @"},
      {sample, with({{"version", PropertyList::Uid{7}}}, sampleMessage), "typeMismatch @version"},
      {payload, Dictionary{{"c", 1}, {"dul", Array{"a", nullptr}}}, "valueNotFound @dul.1"}};
  for (const auto& [target, tree, expected] : rows) {
    EXPECT_EQ(outcome(target, Keelgate::Bytes(PropertyList::writeBinary(tree))), expected);
  }
}

TEST(Decoding, EveryTruncationIsDamage) {
  const Array others{2.5, "x<", data("any"), Dictionary{{"\u00e9\U0001f600", -3}}};
  const Tree tree = with({{"date", PropertyList::Date{5}}, {"other", others}}, sampleMessage);
  std::string xml = PropertyList::writeXml(tree);
  xml.erase(xml.find_last_not_of('\n') + 1);
  const Keelgate::Bytes text = std::as_bytes(std::span(xml));
  for (const Keelgate::Data& whole :
       {PropertyList::writeBinary(tree), {text.begin(), text.end()}}) {
    for (std::size_t length = 0; length < whole.size(); ++length) {
      // A copy of exact size, so that a sanitizer sees a read past the end.
      const Keelgate::Data cut(whole.begin(), whole.begin() + std::ptrdiff_t(length));
      EXPECT_EQ(outcome(sample, Keelgate::Bytes(cut)), "dataCorrupted @") << length;
    }
  }
}

TEST(Decoding, NumbersFillTheFieldsThatHoldThemExactly) {
  const auto sent = [](Tree number) {
    const std::string got = outcome(checkIn, Dictionary{{"messageType", 2},
                                                        {"interfaceVersion", 1},
                                                        {"sendDate", std::move(number)},
                                                        {"messageID", "m"},
                                                        {"sessionID", "s"}});
    const std::size_t at = got.find("sendDate=");
    return at == std::string::npos ? got : got.substr(at + 9, got.find(' ', at) - at - 9);
  };
  // As itself with either sign, or as an error: never as a neighbour.
  const auto expectExactly = [&](std::uint64_t magnitude, bool fits) {
    const std::string text = std::to_string(magnitude) + ".000000";
    EXPECT_EQ(sent(magnitude), fits ? text : "dataCorrupted @sendDate");
    if (magnitude == 0 || magnitude > std::uint64_t{1} << 63) return;
    EXPECT_EQ(sent(static_cast<std::int64_t>(0 - magnitude)),
              fits ? "-" + text : "dataCorrupted @sendDate");
  };
  for (int bits = 0; bits < 64; ++bits) {
    const std::uint64_t power = std::uint64_t{1} << bits;
    expectExactly(power, true);
    expectExactly(power + 1, bits < 53);
    expectExactly(power - 1, bits <= 53);
  }
  expectExactly(std::numeric_limits<std::uint64_t>::max(), false);
  EXPECT_EQ(sent(-2.5), "-2.500000");
  EXPECT_EQ(sent(true), "typeMismatch @sendDate");
}

TEST(Routing, AnUnknownCommandIsLoggedAndRefusedUnread) {
  for (const char* service : {"com.tessen.private.braid.rtcengine.rtctester", video, audio,
                              livePhoto, "com.tessen.private.braid.waymark"}) {
    for (const std::uint64_t command :
         {std::uint64_t{0}, std::uint64_t{999}, std::numeric_limits<std::uint64_t>::max()}) {
      Keelgate::LogCapture log;
      const std::string number = std::to_string(command);
      EXPECT_EQ(outcome({service, command}, Keelgate::Bytes()),
                "breach com.tessen.Keelgate.VespServiceUnpacker: Invalid command ID " + number);
      EXPECT_EQ(log.lines, Keelgate::Array<String>{"Invalid command ID " + number});
    }
  }
  Keelgate::LogCapture log;
  EXPECT_EQ(outcome(sample, Keelgate::Bytes()), "dataCorrupted @");
  EXPECT_EQ(log.lines.size(), 0u) << "a decoding error is not logged";
}

TEST(Constructors, AnyOfThemCanRefuseAndItsErrorArrivesUnchanged) {
  const Array one{Dictionary{}};
  const Tree full = Dictionary{{"c", 1},       {"mml", Array{Dictionary{{"c", 2}}}},
                               {"h", one[0]},  {"Dc", one[0]},
                               {"qplr", one},  {"qal", one},
                               {"qsatv", one}, {"qpla", one}};
  for (const char* name :
       {"PulseUserPayload", "PulseUserPayloadHttpHeaders", "PulseUserPayloadDeliveryContext",
        "PulseHoplinePluginRequest", "PulseHoplineAllocationStatus", "PulseHoplineSelfAllocToken",
        "PulseHoplinePluginAllocation"}) {
    const Refusing refusing(name);
    EXPECT_EQ(outcome(payload, full), std::string("breach test: refused ") + name);
  }
}

}  // namespace

}  // namespace VespKeelgateService::Testing
