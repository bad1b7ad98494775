// SPDX-License-Identifier: Apache-2.0
/// The bodies of replies: what was written is read back, everything else is refused, and what is
/// refused has cost no more than it was allowed to.
#include "framework/transport/error_coding.h"
#include "framework/transport/record_coding.h"

#include <keelgate/records.h>

#include <gtest/gtest.h>
#include <malloc.h>

#include <algorithm>
#include <cstdlib>
#include <limits>
#include <new>

namespace {
std::size_t liveBytes = 0;
std::size_t peakBytes = 0;

/// A block as the allocator keeps it, its own header included.
std::size_t costOf(void* block) {
  return malloc_usable_size(block) + sizeof(std::size_t);
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
  if (block != nullptr) liveBytes -= costOf(block);
  std::free(block);
}
void operator delete(void* block, std::size_t) noexcept {
  operator delete(block);
}

namespace Keelgate::Transport {
namespace {

using Unpacking = VespKeelgateService::VespClientMessageUnpackingError;
using Limit = ReadLimitReached::Limit;

/// Reads the error and writes it again, with the fields that were thrown.
Data errorAgain(Bytes body, const ReadLimits& limits = {}) {
  try {
    throwError(body, limits);
  } catch (const DecodingError& error) {
    return encodeError(error);
  } catch (const Breach& error) {
    return encodeError(error);
  } catch (const Unpacking& error) {
    return encodeError(error);
  }
}

template <Record R>
Data recordAgain(Bytes body, const ReadLimits& limits = {}) {
  return encodeRecord(decodeRecord<R>(body, limits));
}

struct Sample {
  const char* name;
  Data body;
  Data (*readAgain)(Bytes, const ReadLimits&);
};

std::vector<Sample> samples() {
  VespCommandResponse response{};
  response.command = -7;
  response.applicationId = String(1000, 'a');
  VespInvitation invitation{};
  PulseUserPayload payload{};
  payload.ostrelMessageList.resize(3);
  payload.ostrelMessageList[1].ostrelMessageList.resize(2);
  using Kind = DecodingError::Kind;
  const DecodingError missing(Kind::keyNotFound, "k", {String("a"), std::size_t{1}}, "missing");
  return {
      {"a response", encodeRecord(response), recordAgain<VespCommandResponse>},
      {"an invitation", encodeRecord(invitation), recordAgain<VespInvitation>},
      {"a payload", encodeRecord(payload), recordAgain<PulseUserPayload>},
      {"a missing key", encodeError(missing), errorAgain},
      {"damage", encodeError(DecodingError(Kind::dataCorrupted, {}, {}, "why")), errorAgain},
      {"a breach", encodeError(Breach("domain", "type", "path")), errorAgain},
      {"a breach without a path", encodeError(Breach("domain", "type")), errorAgain},
      {"a command", encodeError(Unpacking::unimplementedCommand(*CommandType::fromRawValue(232))),
       errorAgain},
      {"a service", encodeError(Unpacking::noUnpackerForService("s")), errorAgain}};
}

TEST(Reply, EveryBodyIsReadBackAndNoOtherLengthIs) {
  for (const Sample& sample : samples()) {
    EXPECT_EQ(sample.readAgain(sample.body, {}), sample.body) << sample.name;
    for (std::size_t length = 0; length < sample.body.size(); ++length) {
      EXPECT_THROW(sample.readAgain(Bytes(sample.body).first(length), {}), MalformedReply)
          << sample.name << ' ' << length;
    }
    Data longer = sample.body;
    longer.push_back(std::byte{});
    EXPECT_THROW(sample.readAgain(longer, {}), MalformedReply) << sample.name;
  }
}

/// The fields themselves, which a coding that loses one both ways would not show.
TEST(Reply, ErrorsKeepTheirFields) {
  try {
    throwError(encodeError(
        DecodingError(DecodingError::Kind::keyNotFound, "k", {String("a"), std::size_t{7}}, "d")));
  } catch (const DecodingError& error) {
    EXPECT_EQ(error.kind, DecodingError::Kind::keyNotFound);
    EXPECT_EQ(error.key, "k");
    EXPECT_EQ(error.codingPath, (Array<CodingKey>{String("a"), std::size_t{7}}));
    EXPECT_EQ(error.debugDescription, "d");
  }
  for (const Optional<String>& path : {Optional<String>("p"), Optional<String>()}) {
    try {
      throwError(encodeError(Breach("domain", "type", path)));
    } catch (const Breach& error) {
      EXPECT_EQ(error.domain, "domain");
      EXPECT_EQ(error.errorType, "type");
      EXPECT_EQ(error.keyPath, path);
    }
  }
}

Data wordsOf(std::initializer_list<std::uint64_t> words) {
  Writer to;
  for (const std::uint64_t word : words) to.word(word);
  return std::move(to).take();
}

template <class T>
void readValue(Bytes body) {
  Reader from(body, {});
  T value{};
  read(from, value, 0);
  from.end();
}

TEST(Reply, ValuesThatNoHonestServiceWritesAreRefused) {
  const auto number = [](double value) {
    return wordsOf({std::bit_cast<std::uint64_t>(value)});
  };
  using Limits = std::numeric_limits<double>;
  EXPECT_NO_THROW(readValue<Date>(number(1.5)));
  EXPECT_NO_THROW(readValue<Double>(number(Limits::infinity())));
  for (const double value : {Limits::infinity(), -Limits::infinity(), Limits::quiet_NaN()}) {
    EXPECT_THROW(readValue<Date>(number(value)), MalformedReply) << value;
  }
  EXPECT_NO_THROW(readValue<WMMessageType>(wordsOf({0})));
  for (const std::uint64_t value : {std::uint64_t{99}, std::uint64_t{1} << 32, ~std::uint64_t{0}}) {
    EXPECT_THROW(readValue<WMMessageType>(wordsOf({value})), MalformedReply) << value;
  }
  for (const unsigned byte : {2U, 255U}) {
    EXPECT_THROW(readValue<Bool>(Data{std::byte(byte)}), MalformedReply);
    EXPECT_THROW(readValue<Optional<Bool>>(Data{std::byte(byte), std::byte{}}), MalformedReply);
    // A kind of error, and the same of what has no case.
    EXPECT_THROW(throwError(Data(100, std::byte(byte == 2 ? 3 : byte))), MalformedReply);
  }
  using Result = VespClientMessageResult;
  EXPECT_THROW(decodeRecord<Result>(Data(4000, std::byte{200})), MalformedReply);
  for (const char* text : {"\xff", "\xc0\x80", "\xed\xa0\x80", "\xf4\x90\x80\x80", "a\xc3"}) {
    Writer to;
    to.text(text);
    EXPECT_THROW(readValue<String>(std::move(to).take()), MalformedReply);
  }
}

TEST(Reply, ErrorsHaveExactlyTheFieldsOfTheirKind) {
  using Kind = DecodingError::Kind;
  const auto refused = [](const Data& body) {
    EXPECT_THROW(throwError(body), MalformedReply);
  };
  refused(encodeError(DecodingError(Kind::keyNotFound, {}, {}, "")));
  for (const Kind kind : {Kind::typeMismatch, Kind::valueNotFound, Kind::dataCorrupted, Kind{4}}) {
    refused(encodeError(DecodingError(kind, "k", {}, "")));
  }
  refused(encodeError(DecodingError(Kind{4}, {}, {}, "")));
  const auto path = [](std::size_t steps) {
    return encodeError(DecodingError(Kind::typeMismatch, {}, Array<CodingKey>(steps), ""));
  };
  EXPECT_EQ(errorAgain(path(512)), path(512));
  refused(path(513));
  Data command = encodeError(Unpacking::unimplementedCommand(*CommandType::fromRawValue(232)));
  command[2] = std::byte{0xff};
  refused(command);
}

/// Lengths and counts at the edges of what is there and of 64 bits.
TEST(Reply, LengthsAndCountsNeverReachBeyondTheBytes) {
  constexpr std::uint64_t most = ~std::uint64_t{0};
  for (const std::uint64_t length : {std::uint64_t{2}, most, most - 7, most / 2 + 1}) {
    Data body = wordsOf({length});
    body.push_back(std::byte{});
    EXPECT_THROW(readValue<String>(body), MalformedReply) << length;
    EXPECT_THROW(readValue<Data>(body), MalformedReply) << length;
    EXPECT_THROW(readValue<Array<UUID>>(body), MalformedReply) << length;
    EXPECT_THROW(readValue<Array<Int>>(body), MalformedReply) << length;
  }
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

std::vector<Hungry> hungryBodies() {
  PulseUserPayload payloads{};
  payloads.ostrelMessageList.resize(500);
  PulseUserPayload mixed{};
  mixed.ostrelMessageList.resize(20);
  for (PulseUserPayload& payload : mixed.ostrelMessageList) payload.ostrelMessageList.resize(20);
  VespCommandResponse text{};
  text.applicationId = String(100'000, 'a');
  const Breach breach(String(100'000, 'b'), "type", String(100, 'c'));
  return {{"payloads", encodeRecord(payloads), readRecordOf<PulseUserPayload>},
          {"payloads in payloads", encodeRecord(mixed), readRecordOf<PulseUserPayload>},
          {"a text", encodeRecord(text), readRecordOf<VespCommandResponse>},
          {"a breach", encodeError(breach), [](Bytes body, const ReadLimits& limits) {
             try {
               throwError(body, limits);
             } catch (const Breach&) {
             }
           }}};
}

/// The least memory that the body can be read with.
std::size_t memoryFor(const Hungry& hungry) {
  std::size_t low = 0;
  std::size_t high = std::size_t{1} << 30;
  while (low + 1 < high) {
    const std::size_t middle = (low + high) / 2;
    try {
      hungry.read(hungry.body, {.memory = middle});
      high = middle;
    } catch (const ReadLimitReached& reached) {
      EXPECT_EQ(reached.limit, Limit::memory);
      low = middle;
    }
  }
  return high;
}

#ifndef KEELGATE_UNSEALED
TEST(Reply, C12ReadingNeverTakesMoreThanItsMemory) {
  for (const Hungry& hungry : hungryBodies()) {
    const std::size_t memory = memoryFor(hungry);
    // At its end, and at points on the way: with less of it the reader stops earlier.
    for (const std::size_t part : {1U, 2U, 3U, 10U}) {
      const std::size_t before = peakBytes = liveBytes;
      try {
        hungry.read(hungry.body, {.memory = memory / part});
        EXPECT_EQ(part, 1U) << hungry.name;
        EXPECT_GT(peakBytes - before, memory / 2) << hungry.name;
      } catch (const ReadLimitReached&) {
        EXPECT_NE(part, 1U) << hungry.name;
      }
      // An error that is thrown makes a sentence as well, which repeats its texts.
      const std::size_t sentence = hungry.name == std::string_view("a breach") ? 3 * memory : 0;
      EXPECT_LE(peakBytes - before, memory / part + sentence + 1024) << hungry.name << ' ' << part;
    }
  }
}
#endif

TEST(Reply, C12TheDeadlineIsLookedAtWhileReading) {
  for (const Hungry& hungry : hungryBodies()) {
    try {
      hungry.read(hungry.body, {.deadline = std::chrono::steady_clock::now()});
      ADD_FAILURE() << hungry.name;
    } catch (const ReadLimitReached& reached) {
      EXPECT_EQ(reached.limit, Limit::time) << hungry.name;
    }
  }
  // One that passes on the way.
  PulseUserPayload many{};
  many.ostrelMessageList.resize(20'000);
  const Data body = encodeRecord(many);
  const auto soon = std::chrono::steady_clock::now() + std::chrono::milliseconds(1);
  EXPECT_THROW(decodeRecord<PulseUserPayload>(body, {.deadline = soon}), ReadLimitReached);
}

/// So many payloads, each the only element of the list before it.
Data nestedPayloads(std::size_t depth) {
  PulseUserPayload payload{};
  const Data flat = encodeRecord(payload);
  payload.ostrelMessageList.emplace_back(PulseUserPayload{});
  const Data one = encodeRecord(payload);
  const auto count = std::mismatch(flat.begin(), flat.end(), one.begin()).first - flat.begin();
  Data all;
  for (std::size_t i = 1; i < depth; ++i) {
    all.insert(all.end(), one.begin(), one.begin() + count + 8);
  }
  all.insert(all.end(), flat.begin(), flat.end());
  for (std::size_t i = 1; i < depth; ++i)
    all.insert(all.end(), flat.begin() + count + 8, flat.end());
  return all;
}

TEST(Reply, C8NestingEndsBeforeTheStackOfTheClientDoes) {
  // Each payload takes an array and a dictionary; the outermost is not in an array.
  constexpr std::size_t most = 1 + maximumNesting / 2;
  EXPECT_NO_THROW(decodeRecord<PulseUserPayload>(nestedPayloads(most)));
  EXPECT_THROW(decodeRecord<PulseUserPayload>(nestedPayloads(most + 1)), MalformedReply);
  EXPECT_THROW(decodeRecord<PulseUserPayload>(nestedPayloads(50'000)), MalformedReply);
}

}  // namespace
}  // namespace Keelgate::Transport
