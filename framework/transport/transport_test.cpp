// SPDX-License-Identifier: Apache-2.0
/// The bodies of replies: what was written is read back, everything else is refused, and what is
/// refused has cost no more than it was allowed to.
#include "framework/transport/error_coding.h"
#include "framework/transport/record_coding.h"
#include "tests/filler.h"

#include <keelgate/records.h>

#include <gtest/gtest.h>
#include <malloc.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <new>

namespace {
std::size_t liveBytes = 0;
std::size_t peakBytes = 0;

/// A block as the allocator keeps it, its own header included.
std::size_t costOf(void* block) {
  return malloc_usable_size(block) + sizeof(std::size_t);
}

void giveBack(void* block) noexcept {
  if (block != nullptr) liveBytes -= costOf(block);
  std::free(block);
}
}  // namespace

void* operator new(std::size_t size) {
  void* const block = std::malloc(size);
  if (block == nullptr) throw std::bad_alloc();
  liveBytes += costOf(block);
  peakBytes = std::max(peakBytes, liveBytes);
  return block;
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
auto visitError(Bytes body, Visit visit) {
  try {
    throwError(body);
  } catch (const DecodingError& error) {
    return visit(error);
  } catch (const Breach& error) {
    return visit(error);
  } catch (const Unpacking& error) {
    return visit(error);
  }
}

/// Reads the error and writes it again, with the fields that were thrown.
Data errorAgain(Bytes body) {
  return visitError(body, [](const auto& error) { return encodeError(error); });
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
Data recordAgain(Bytes body) {
  return encodeRecord(decodeRecord<R>(body));
}

struct Sample {
  String name;
  Data body;
  Data (*readAgain)(Bytes);
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
      if (start > 0 && encodeRecord(record).size() == all.back().body.size()) continue;
      all.push_back({String(typeName<R>()), encodeRecord(record), recordAgain<R>});
    }
  });
  const auto add = [&](const auto& error) {
    all.push_back({textOf(error), encodeError(error), errorAgain});
  };
  add(DecodingError(Kind::keyNotFound, "k", {String("a"), std::size_t{7}}, "missing"));
  add(DecodingError(Kind::typeMismatch, {}, Array<CodingKey>(512), ""));
  add(DecodingError(Kind::dataCorrupted, {}, {}, "why"));
  add(Breach("domain", "type", "path"));
  add(Breach("domain", "type"));
  add(Unpacking::unimplementedCommand(*CommandType::fromRawValue(232)));
  add(Unpacking::noUnpackerForService("s"));
  return all;
}

TEST(Reply, EveryBodyIsReadBackAndNoOtherLengthIs) {
  for (const Sample& sample : samples()) {
    EXPECT_EQ(sample.readAgain(sample.body), sample.body) << sample.name;
    if (sample.readAgain == errorAgain) {
      EXPECT_EQ(visitError(sample.body, [](const auto& error) { return textOf(error); }),
                sample.name);
    }
    for (std::size_t length = 0; length < sample.body.size(); ++length) {
      EXPECT_THROW(sample.readAgain(Bytes(sample.body).first(length)), MalformedReply)
          << sample.name << ' ' << length;
    }
    Data longer = sample.body;
    longer.push_back(std::byte{});
    EXPECT_THROW(sample.readAgain(longer), MalformedReply) << sample.name;
  }
}

TEST(Reply, WhatIsLongIsLentAndOutlivesItsRecord) {
  VespCommandWebTunnelResponse record{};
  record.contentType = String(100'000, 'a');
  record.messageUUID = Data(100'000, std::byte{7});
  Body lent = lendRecord(record);
  EXPECT_LT(lent.bytes.size(), 1000u);
  EXPECT_EQ(std::move(lent).joined(), encodeRecord(record));
}

/// With any one byte changed it is known to be a lie, or is the one spelling of another record or
/// error that an honest service might send.
TEST(Reply, NoChangedByteDoesMore) {
  // In a slow build one bit of each byte.
#ifdef NDEBUG
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
    EXPECT_THROW(decodeRecord<PropertyList>(encodeRecord(list)), MalformedReply) << seconds;
  }
  list.value = String("\xff");
  EXPECT_THROW(decodeRecord<PropertyList>(encodeRecord(list)), MalformedReply);
  WaymarkMessage message{};
  message.messageType = static_cast<WMMessageType>(casesOf<WMMessageType>.back().rawValue + 1);
  const VespClientMessageResult result{.result = message};
  EXPECT_THROW(decodeRecord<VespClientMessageResult>(encodeRecord(result)), MalformedReply);
}

/// A body that takes far more memory than it has bytes, and what reads it.
struct Hungry {
  const char* name;
  Data body;
  void (*read)(Bytes, const ReadLimits&);
};

template <Record R>
void readRecordOf(Bytes body, const ReadLimits& limits) {
  static_cast<void>(decodeRecord<R>(body, limits));
}

void readError(Bytes body, const ReadLimits& limits) {
  try {
    throwError(body, limits);
  } catch (const Breach&) {
  } catch (const DecodingError&) {
  }
}

std::vector<Hungry> hungryBodies() {
  PulseUserPayload payloads{};
  payloads.ostrelMessageList.resize(500);
  PulseUserPayload mixed{};
  mixed.ostrelMessageList.resize(20);
  for (PulseUserPayload& payload : mixed.ostrelMessageList) payload.ostrelMessageList.resize(20);
  VespCommandResponse text{};
  text.applicationId = String(100'000, 'a');
  const DecodingError path(DecodingError::Kind::typeMismatch, {}, Array<CodingKey>(512), "");
  const Breach breach(String(100'000, 'b'), "type", String(100, 'c'));
  return {{"payloads", encodeRecord(payloads), readRecordOf<PulseUserPayload>},
          {"payloads in payloads", encodeRecord(mixed), readRecordOf<PulseUserPayload>},
          {"a text", encodeRecord(text), readRecordOf<VespCommandResponse>},
          {"a breach", encodeError(breach), readError},
          {"a path", encodeError(path), readError}};
}

#ifndef KEELGATE_UNSEALED
TEST(Reply, C12ReadingNeverTakesMoreThanItsMemory) {
  for (const Hungry& hungry : hungryBodies()) {
    // Stopped at points on the way, until it is enough.
    bool isRead = false;
    for (std::size_t memory = 512; !isRead; memory += memory / 4) {
      const std::size_t before = peakBytes = liveBytes;
      try {
        hungry.read(hungry.body, {.memory = memory});
        isRead = true;
        EXPECT_GT(peakBytes - before, memory / 3) << hungry.name;
      } catch (const ReadLimitReached& reached) {
        EXPECT_EQ(reached.limit, Limit::memory);
      }
      // An error that is thrown makes a sentence as well, which repeats its texts.
      const std::size_t sentence = isRead && hungry.read == readError ? 3 * memory : 0;
      EXPECT_LE(peakBytes - before, memory + sentence + 1024) << hungry.name << ' ' << memory;
    }
  }
}
#endif

TEST(Reply, C12TheDeadlineIsLookedAtWhileReading) {
  using Clock = std::chrono::steady_clock;
  for (const Hungry& hungry : hungryBodies()) {
    EXPECT_THROW(hungry.read(hungry.body, {.deadline = Clock::now()}), ReadLimitReached)
        << hungry.name;
  }
  // One that passes on the way.
  PulseUserPayload many{};
  many.ostrelMessageList.resize(20'000);
  const Data body = encodeRecord(many);
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
    return encodeRecord(nested);
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
  EXPECT_NO_THROW(decodeRecord<PropertyList>(encodeRecord(list)));
  Array<PropertyListValue> outermost;
  outermost.push_back(std::move(list.value));
  list.value.emplace<Array<PropertyListValue>>(std::move(outermost));
  EXPECT_THROW(decodeRecord<PropertyList>(encodeRecord(list)), MalformedReply);
}

}  // namespace
}  // namespace Keelgate::Transport
