// SPDX-License-Identifier: Apache-2.0
/// The bodies of replies: what was written is read back, everything else is refused, and what is
/// refused has cost no more than it was allowed to.
#include "framework/protocol/frames.h"
#include "framework/transport/error_coding.h"
#include "framework/transport/record_coding.h"
#include "tests/filler.h"

#include <keelgate/records.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <new>

namespace {
std::size_t liveBytes = 0;
std::size_t peakBytes = 0;
/// The peak where a body had been read, before it was written again.
std::size_t readBytes = 0;

/// Not inlined: g++ 14 would take `free` for the other half of `new`.
[[gnu::noinline]] void giveBack(void* block) noexcept {
  if (block == nullptr) return;
  std::size_t* const cost = static_cast<std::size_t*>(block) - 2;
  liveBytes -= *cost;
  std::free(cost);
}
}  // namespace

/// Behind what it costs: the allocator keeps a header of 8 bytes in front of each block, whose
/// lengths are 32, 48, 64 and so on, unless a longer one happens to be free.
void* operator new(std::size_t size) {
  auto* const cost = static_cast<std::size_t*>(std::malloc(size + 16));
  if (cost == nullptr) throw std::bad_alloc();
  for (*cost = 32; *cost < size + 8;) *cost += 16;
  liveBytes += *cost;
  peakBytes = std::max(peakBytes, liveBytes);
  return cost + 2;
}
void operator delete(void* block) noexcept {
  giveBack(block);
}
void operator delete(void* block, std::size_t) noexcept {
  giveBack(block);
}

namespace Keelgate::Transport {
namespace {

using Unpacking = VespKeelgateService::VespClientMessageUnpackingError;
using Limit = ReadLimitReached::Limit;

template <class Visit>
auto visitError(Bytes body, Visit visit, const ReadLimits& limits = {}) {
  try {
    throwError(body, limits);
  } catch (const DecodingError& error) {
    return visit(error);
  } catch (const Breach& error) {
    return visit(error);
  } catch (const Unpacking& error) {
    return visit(error);
  }
}

/// Reads the error and writes it again, with the fields that were thrown.
Data errorAgain(Bytes body, const ReadLimits& limits) {
  return visitError(
      body, [](const auto& error) { return readBytes = peakBytes, encodeError(error); }, limits);
}

/// With all fields: one that a coding loses both ways does not show in its bytes.
template <class E>
String textOf(const E& error) {
  String text = error.what();
  if constexpr (std::same_as<E, Breach>) text += error.keyPath.value_or(" everywhere");
  if constexpr (std::same_as<E, DecodingError>) {
    text += String(nameOf(error.kind)) + error.key.value_or("");
  }
  return text;
}

template <Record R>
Data recordAgain(Bytes body, const ReadLimits& limits) {
  const R record = decodeRecord<R>(body, limits);
  readBytes = peakBytes;
  return lendRecord(record).joined();
}

struct Sample {
  String name;
  Data body;
  Data (*read)(Bytes, const ReadLimits&);

  [[nodiscard]] Data readAgain(Bytes from) const { return read(from, {}); }
};

/// Of every record with all of its fields, in all of its cases, and of every error.
std::vector<Sample> samples() {
  using Kind = DecodingError::Kind;
  std::vector<Sample> all;
  OutputRecords::each([&]<class R>(std::type_identity<R>) {
    // As many as a case-keyed value has cases.
    for (int start = 0; start < (std::same_as<R, PulseUserPayload> ? 1 : 12); ++start) {
      R record{};
      Testing::Filler(1, 1, start, true).fill(record);
      if (start > 0 && lendRecord(record).joined().size() == all.back().body.size()) continue;
      all.push_back({String(typeName<R>()), lendRecord(record).joined(), recordAgain<R>});
    }
  });
  const auto add = [&](const auto& error) {
    all.push_back({textOf(error), encodeError(error), errorAgain});
  };
  add(DecodingError(Kind::keyNotFound, "k", {String("a"), std::size_t{7}}, "missing"));
  add(DecodingError(Kind::typeMismatch, {}, Array<CodingKey>(512), ""));
  add(DecodingError(Kind::dataCorrupted, {}, {}, "why"));
  add(Breach(String(500, 'd'), "type", String(500, 'p')));
  add(Breach("domain", "type"));
  add(Unpacking::unimplementedCommand(*CommandType::fromRawValue(232)));
  add(Unpacking::noUnpackerForService("s"));
  return all;
}

TEST(Reply, EveryBodyIsReadBackAndNoOtherLengthIs) {
  for (const Sample& sample : samples()) {
    EXPECT_EQ(sample.readAgain(sample.body), sample.body) << sample.name;
    if (sample.read == errorAgain) {
      EXPECT_EQ(visitError(sample.body, [](const auto& error) { return textOf(error); }),
                sample.name);
    }
    for (std::size_t length = 0; length < sample.body.size(); ++length) {
      EXPECT_THROW(static_cast<void>(sample.readAgain(Bytes(sample.body).first(length))),
                   MalformedReply)
          << sample.name << ' ' << length;
    }
    Data longer = sample.body;
    longer.push_back(std::byte{});
    EXPECT_THROW(static_cast<void>(sample.readAgain(longer)), MalformedReply) << sample.name;
  }
}

/// A client would take one field for another where a service writes something else.
TEST(Reply, HasTheFormThatTheProtocolsVersionStandsFor) {
  std::uint64_t digest = 0xcbf2'9ce4'8422'2325;
  for (const Sample& sample : samples()) {
    for (const std::byte octet : sample.body) {
      digest = (digest ^ static_cast<std::uint8_t>(octet)) * 0x100'0000'01b3;
    }
  }
  EXPECT_EQ(std::pair(Protocol::protocolVersion, digest),
            std::pair(std::uint16_t{8}, std::uint64_t{0x9c2f0789e33cdfb9}))
      << "Replies have changed: raise protocolVersion, and put both numbers here.";
}

TEST(Reply, WhatIsLongIsLent) {
  VespCommandWebTunnelResponse record{};
  record.contentType = String(100'000, 'a');
  record.messageUUID = Data(100'000, std::byte{7});
  Body lent = lendRecord(record);
  EXPECT_LT(lent.bytes.size(), 1000u);
  const auto again = decodeRecord<VespCommandWebTunnelResponse>(std::move(lent).joined());
  EXPECT_EQ(again.contentType, record.contentType);
  EXPECT_EQ(again.messageUUID, record.messageUUID);
}

/// With any one byte changed it is known to be a lie, or is the one spelling of another record or
/// error that an honest service might send.
TEST(Reply, NoChangedByteDoesMore) {
  // In a slow build, and on what is emulated as a rule, one bit of each byte.
#if defined(NDEBUG) && defined(__x86_64__)
  constexpr bool isFast = true;
#else
  constexpr bool isFast = false;
#endif
  for (const Sample& sample : samples()) {
    Data other = sample.body;
    for (std::size_t i = 0; i < other.size(); ++i) {
      for (int change = isFast ? 1 : 1 << i % 8; change < 256; change += isFast ? 1 : 256) {
        other[i] = sample.body[i] ^ static_cast<std::byte>(change);
        try {
          EXPECT_EQ(sample.readAgain(other), other) << sample.name << ' ' << i << ": " << change;
        } catch (const MalformedReply&) {
        }
      }
      other[i] = sample.body[i];
    }
  }
}

TEST(Reply, WhatNoHonestServiceWritesIsRefused) {
  using Kind = DecodingError::Kind;
  for (const DecodingError& wrong :
       {DecodingError(Kind::keyNotFound, {}, {}, ""),
        DecodingError(Kind::typeMismatch, "k", {}, ""),
        DecodingError(Kind::valueNotFound, "k", {}, ""),
        DecodingError(Kind::dataCorrupted, "k", {}, ""), DecodingError(Kind{4}, {}, {}, ""),
        DecodingError(Kind::typeMismatch, {}, Array<CodingKey>(513), "")}) {
    EXPECT_THROW(throwError(encodeError(wrong)), MalformedReply) << wrong.what();
  }
  PropertyList list{};
  for (const double seconds : {std::nan(""), HUGE_VAL, -HUGE_VAL}) {
    list.value = Date{seconds};
    EXPECT_THROW(decodeRecord<PropertyList>(lendRecord(list).joined()), MalformedReply) << seconds;
  }
  list.value = String("\xff");
  EXPECT_THROW(decodeRecord<PropertyList>(lendRecord(list).joined()), MalformedReply);
  WaymarkMessage message{};
  message.messageType = static_cast<WMMessageType>(casesOf<WMMessageType>.back().rawValue + 1);
  const VespClientMessageResult result{.result = message};
  EXPECT_THROW(decodeRecord<VespClientMessageResult>(lendRecord(result).joined()), MalformedReply);
}

#ifndef KEELGATE_UNSEALED
TEST(Reply, C12ReadingTakesTheMemoryThatItIsChargedAndNoMore) {
  const auto fits = [](const Sample& sample, std::size_t memory) {
    const std::size_t before = peakBytes = liveBytes;
    try {
      static_cast<void>(sample.read(sample.body, {.memory = memory}));
      return true;
    } catch (const ReadLimitReached& reached) {
      EXPECT_EQ(reached.limit, Limit::memory);
      EXPECT_LE(peakBytes - before, memory) << sample.name;
      return false;
    }
  };
  std::vector<Sample> all = samples();
  // A single block of whatever kind.
  for (std::size_t size = 0; size < 100; ++size) {
    for (const PropertyListValue& value :
         {PropertyListValue(String(size, 'a')), PropertyListValue(Data(size)),
          PropertyListValue(Array<PropertyListValue>(size))}) {
      all.push_back({std::to_string(size), lendRecord(PropertyList{value}).joined(),
                     recordAgain<PropertyList>});
    }
  }
  for (const Sample& sample : all) {
    const std::size_t before = liveBytes;
    ASSERT_TRUE(fits(sample, memoryBudget(0)));
    const std::size_t cost = readBytes - before;
    EXPECT_TRUE(fits(sample, cost)) << sample.name;
    // An error that is thrown makes a sentence as well, which repeats its texts.
    const bool isError = sample.read == errorAgain;
    if (cost <= (isError ? 1000 : 0)) continue;
    EXPECT_FALSE(fits(sample, cost / 4)) << sample.name;
    EXPECT_TRUE(isError || !fits(sample, cost - 1)) << sample.name;
  }
}
#endif

TEST(Reply, C12TheDeadlineIsLookedAtWhileReading) {
  using Clock = std::chrono::steady_clock;
  for (const Sample& sample : samples()) {
    EXPECT_THROW(sample.read(sample.body, {.deadline = Clock::now()}), ReadLimitReached);
  }
  // One that passes on the way.
  PulseUserPayload many{};
  many.ostrelMessageList.resize(20'000);
  const Data body = lendRecord(many).joined();
  try {
    decodeRecord<PulseUserPayload>(body, {.deadline = Clock::now() + std::chrono::milliseconds(1)});
    ADD_FAILURE();
  } catch (const ReadLimitReached& reached) {
    EXPECT_EQ(reached.limit, Limit::time);
  }
}

TEST(Reply, C8NestingEndsBeforeTheStackOfTheClientDoes) {
  // Each payload takes an array and a dictionary; the outermost is not in an array.
  const auto body = [&](int containers) {
    PulseUserPayload nested{};
    for (; containers > 0; containers -= 2) {
      PulseUserPayload outer{};
      outer.ostrelMessageList.push_back(std::move(nested));
      nested = std::move(outer);
    }
    return lendRecord(nested).joined();
  };
  EXPECT_NO_THROW(decodeRecord<PulseUserPayload>(body(maximumNesting)));
  EXPECT_THROW(decodeRecord<PulseUserPayload>(body(maximumNesting + 2)), MalformedReply);
  // An entry is part of its dictionary.
  PropertyList list{};
  for (int containers = 1; containers <= maximumNesting; ++containers) {
    Array<PropertyListEntry> entries;
    entries.push_back({.key = "k", .value = std::move(list.value)});
    list.value.emplace<Array<PropertyListEntry>>(std::move(entries));
  }
  EXPECT_NO_THROW(decodeRecord<PropertyList>(lendRecord(list).joined()));
  Array<PropertyListValue> outermost;
  outermost.push_back(std::move(list.value));
  list.value.emplace<Array<PropertyListValue>>(std::move(outermost));
  EXPECT_THROW(decodeRecord<PropertyList>(lendRecord(list).joined()), MalformedReply);
}

}  // namespace
}  // namespace Keelgate::Transport
