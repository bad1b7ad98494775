// SPDX-License-Identifier: Apache-2.0
// Batches, and calls that an event loop of the application drives.
#include "framework/client/exchange.h"
#include "framework/transport/error_coding.h"
#include "tests/host/host_testing.h"
#include "tests/reply_frame.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <ctime>
#include <new>

namespace {
/// How many allocations of this thread succeed before one fails, or every one from then on; below 0
/// all do.
thread_local int allocationsLeft = -1;
thread_local bool failForGood = false;

bool hasFailed() {
  if (failForGood && allocationsLeft == 0) return true;
  return allocationsLeft >= 0 && allocationsLeft-- == 0;
}

/// Not inlined: g++ 14 would take `free` for the other half of `new`.
[[gnu::noinline]] void giveBack(void* block) noexcept {
  std::free(block);
}
}  // namespace

void* operator new(std::size_t size) {
  void* const block = hasFailed() ? nullptr : std::malloc(size);
  if (block == nullptr) throw std::bad_alloc();
  return block;
}
void operator delete(void* block) noexcept {
  giveBack(block);
}
void operator delete(void* block, std::size_t) noexcept {
  giveBack(block);
}

namespace Keelgate::Host {
namespace {

using Response = VespCommandResponse;

Script answer(Int number, std::uint32_t after = 0) {
  return Script().then(Op::pause, after).answer(number);
}

String outcomeOf(Outcome<Response>& outcome) {
  return Host::outcomeOf([&] { return outcome.record().command; });
}

/// An application's loop: dispatches when the descriptor says so, and not otherwise.
template <class Condition>
bool loopUntil(Client& client, Condition condition, milliseconds limit = milliseconds(10'000)) {
  const auto end = steady_clock::now() + limit;
  while (!condition() && steady_clock::now() < end) {
    pollfd entry{.fd = client.descriptor(), .events = POLLIN, .revents = 0};
    if (poll(&entry, 1, 100) > 0) client.dispatch();
  }
  return condition();
}

/// Messages with the outcome that each must have.
struct Sent {
  std::vector<Script> scripts;
  std::vector<String> expected;
  std::vector<Client::Request> requests;

  explicit Sent(Int count) {
    for (Int i = 0; i < count; ++i) {
      // Between them more go alone than a service has slots.
      const bool dies = i % 17 == 3;
      const bool lies = i % 17 == 5;
      scripts.push_back(dies ? Script().then(Op::raise, SIGSEGV) : answer(i, i % 3 == 0 ? 5 : 0));
      if (lies) scripts.back() = Script().answer(Data(3));
      expected.push_back(dies   ? "crashed"
                         : lies ? "protocolViolation"
                                : "record " + std::to_string(i));
    }
    // With names of many lengths in front of the messages.
    for (const Script& script : scripts) {
      const String service(requests.size() % 5, 's');
      requests.push_back({.message = script, .context = {.command = none, .service = service}});
    }
  }
};

/// In pieces of any size: the end of one reply and the beginning of the next often come together.
TEST(Exchange, GivesEachReplyWhole) {
  constexpr std::uint32_t first = 7;
  const std::size_t sizes[] = {0, 70'000, 3, 200'000, 1};
  const OutgoingMessage request{.record = 0, .command = 1, .service = "s", .message = {}};
  for (const std::size_t piece : {1'000U, 69'999U, 300'000U}) {
    int ends[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
    Exchange exchange(ends[0], first);
    Data replies;
    for (std::uint32_t i = 0; i < std::size(sizes); ++i) {
      exchange.add(request);
      Testing::appendReplyFrame(replies, first + i, Protocol::ReplyKind::record,
                                Data(sizes[i], std::byte(i)));
    }
    Bytes left = replies;
    for (std::size_t i = 0; i < std::size(sizes); ++i) {
      while (exchange.advance() != Exchange::State::answered) {
        const ssize_t n = send(ends[1], left.data(), std::min(piece, left.size()), MSG_DONTWAIT);
        ASSERT_GT(n, 0) << piece << ' ' << i;
        left = left.subspan(static_cast<std::size_t>(n));
      }
      EXPECT_TRUE(std::ranges::equal(exchange.body(), Data(sizes[i], std::byte(i)))) << i;
      exchange.drop();
    }
    for (const int end : ends) close(end);
  }
}

/// However long a reply says that it is, it is gathered up to a bound that follows the message.
TEST(Exchange, BoundsTheReplyByItsMessage) {
  constexpr std::size_t mebibyte = std::size_t{1} << 20;
  const Data message(mebibyte);
  const std::pair<std::size_t, std::uint64_t> rows[] = {
      {0, 2 * mebibyte + 1}, {1000, 2 * mebibyte + 1 + 128'000}, {mebibyte, 96 * mebibyte}};
  for (const auto& [length, bound] : rows) {
    for (const bool above : {false, true}) {
      int ends[2];
      ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
      Exchange exchange(ends[0], 0);
      exchange.add(
          {.record = 0, .command = 1, .service = "s", .message = Bytes(message).first(length)});
      Data taken(2 * mebibyte);
      while (exchange.advance() == Exchange::State::sending)
        recv(ends[1], taken.data(), taken.size(), 0);
      const auto header =
          Protocol::makeReplyHeader(0, Protocol::ReplyKind::record, bound + above, false);
      EXPECT_EQ(write(ends[1], &header, sizeof header), sizeof header);
      EXPECT_EQ(exchange.advance(), above ? Exchange::State::violated : Exchange::State::receiving);
      for (const int end : ends) close(end);
    }
  }
}

TEST(Batch, GivesEachMessageItsOwnOutcomeInOrder) {
  for (const auto& [processes, allowed] : {std::pair(1u, 1u), {3u, 1u}, {1u, 100u}, {2u, 9u}}) {
    Client::Options options = fakeOptions("honest", milliseconds(20'000), processes);
    options.messagesPerProcess = allowed;
    options.requireLayers = true;
    Client client(options);
    const Sent sent(50);
    std::vector<Outcome<Response>> outcomes = client.unpackBatch<Response>(sent.requests);
    ASSERT_EQ(outcomes.size(), sent.expected.size());
    for (std::size_t i = 0; i < outcomes.size(); ++i) {
      EXPECT_EQ(outcomeOf(outcomes[i]), sent.expected[i]) << i << " of " << allowed;
    }
    EXPECT_TRUE(client.unpackBatch<Response>({}).empty());
  }
}

TEST(Batch, TellsOutcomesAsTheyComeUntilItsVisitorThrows) {
  Client client(fakeOptions());
  const Script slow = answer(0, 300), quick = answer(1), last = answer(2, 60'000);
  const Client::Request requests[] = {
      {.message = slow}, {.message = quick}, {.message = quick}, {.message = last}};
  std::vector<std::size_t> order;
  const auto visit = [&](std::size_t position, Outcome<Response> outcome) {
    EXPECT_EQ(outcomeOf(outcome), position == 0 ? "record 0" : "record 1");
    order.push_back(position);
    if (order.size() == 3) throw std::runtime_error("enough");
  };
  EXPECT_THROW(client.unpackBatch<Response>(requests, visit), std::runtime_error);
  EXPECT_EQ(order, (std::vector<std::size_t>{1, 2, 0}));
  EXPECT_EQ(Host::outcomeOf(client, quick), "record 1");
}

/// Sizes around those at which a channel is widened, and the room for a reply is doubled or mapped.
TEST(Batch, TakesLongMessagesAndRepliesWhole) {
  for (const std::size_t allowed : {1U, 100U}) {
    Client::Options options = fakeOptions();
    options.messagesPerProcess = allowed;
    Client client(options);
    std::vector<Script> scripts;
    // Short ones, which share a worker, are more than may be on the way at a time.
    for (std::size_t size = 1 << 13; size <= 8 << 20; size *= size < 1 << 16 ? 8 : 2) {
      for (const int beside : {-200, -20, 0, 20}) {
        Response record{};
        record.applicationId = String(size + static_cast<std::size_t>(beside), 'a');
        scripts.insert(scripts.end(), size < 1 << 16 ? 8 : 1,
                       Script().answer(Transport::lendRecord(record).joined()));
      }
    }
    std::vector<Client::Request> requests;
    for (const Script& script : scripts) requests.push_back({.message = script});
    std::size_t next = 0;
    for (auto& outcome : client.unpackBatch<Response>(requests)) {
      EXPECT_TRUE(Script().answer(Transport::lendRecord(outcome.record()).joined()) ==
                  scripts[next++]);
    }
  }
}

/// Each message has its own time limit, which begins with its turn: those that share a worker have
/// theirs behind one that goes alone.
TEST(Batch, HoldsEachMessageToItsTimeLimit) {
  for (const std::size_t allowed : {1U, 100U}) {
    const std::clock_t before = std::clock();
    Client::Options options = fakeOptions("honest", milliseconds(900), 1);
    options.messagesPerProcess = allowed;
    Client client(options);
    std::vector<Script> scripts(8, answer(1, 420));
    scripts[0] = answer(1, 540);
    scripts[0].resize(std::size_t{4} << 20);
    scripts[2] = scripts[7] = Script().then(Op::pause, 60'000);
    std::vector<Client::Request> requests;
    for (const Script& script : scripts) requests.push_back({.message = script});
    std::vector<Outcome<Response>> outcomes = client.unpackBatch<Response>(requests);
    for (std::size_t i = 0; i < outcomes.size(); ++i) {
      EXPECT_EQ(outcomeOf(outcomes[i]), i % 5 == 2 ? "timedOut" : "record 1") << i;
    }
    EXPECT_LT(std::clock() - before, CLOCKS_PER_SEC) << "busy while it waits";
  }
}

TEST(Async, IsCancelledAtItsDeadlineAlsoBeforeItsTurn) {
  Client client(fakeOptions("honest", milliseconds(20'000), 1));
  const Script stays = Script().then(Op::pause, 60'000);
  const auto start = steady_clock::now();
  const std::clock_t before = std::clock();
  std::vector<String> seen;
  const auto note = [&](Outcome<Response> outcome) {
    seen.push_back(outcomeOf(outcome));
  };
  client.start<Response>({.message = stays}, note, milliseconds(900));
  for (const int limit : {300, 200}) {
    client.start<Response>({.message = stays}, note, milliseconds(limit));
  }
  EXPECT_TRUE(loopUntil(client, [&] { return seen.size() == 2; }));
  EXPECT_LT(steady_clock::now() - start, milliseconds(800));
  EXPECT_TRUE(loopUntil(client, [&] { return seen.size() == 3; }));
  EXPECT_EQ(seen, std::vector<String>(3, "timedOut"));
  EXPECT_LT(steady_clock::now() - start, milliseconds(1900));
  EXPECT_LT(std::clock() - before, CLOCKS_PER_SEC / 4) << "busy while it waits";
  EXPECT_EQ(Host::outcomeOf(client, answer(1)), "record 1");
}

TEST(Async, CompletionsMayStartMessagesAndThrow) {
  Client client(fakeOptions());
  const Script script = answer(1);
  int rest = 20;
  int thrown = 0;
  std::function<void(Outcome<Response>)> next = [&](const Outcome<Response>&) {
    if (--rest > 0) client.start<Response>({.message = script}, next);
    if (rest % 5 == 0) throw std::runtime_error("from a completion");
  };
  client.start<Response>({.message = script}, next);
  while (rest > 0) {
    try {
      ASSERT_TRUE(loopUntil(client, [&] { return rest <= 0; }));
    } catch (const std::runtime_error&) {
      ++thrown;
    }
  }
  EXPECT_EQ(thrown, 4);
}

/// Whichever it is: the message may be lost with it, or told to be, and nothing else.
TEST(Memory, AnAllocationThatFailsCostsItsMessageAlone) {
  const Script script = answer(1);
  for (const auto& [allowed, forGood] :
       {std::pair(1U, false), {100U, false}, {1U, true}, {100U, true}}) {
    Client::Options options = fakeOptions();
    options.messagesPerProcess = allowed;
    Client client(options);
    const Client::Request request[] = {{.message = script}};
    String told;
    failForGood = forGood;
    const auto batch = [&] {
      for (auto& outcome : client.unpackBatch<Response>(request)) told = outcomeOf(outcome);
    };
    const auto event = [&] {
      client.start<Response>(request[0], [&](auto outcome) { told = outcomeOf(outcome); });
      loopUntil(client, [&] { return !told.empty(); });
    };
    const auto single = [&] {
      told = Host::outcomeOf(client, script);
    };
    for (const std::function<void()>& call : {std::function<void()>(single), {batch}, {event}}) {
      bool failed = true;
      for (int next = 0; failed; ++next) {
        told.clear();
        allocationsLeft = next;
        try {
          call();
        } catch (const std::bad_alloc&) {
          allocationsLeft = -1;
          // What was given up is told of too, once it was taken.
          loopUntil(
              client, [&] { return !told.empty(); }, milliseconds(50));
          if (told.empty()) told = "resourcesExhausted";
        }
        failed = std::exchange(allocationsLeft, -1) < (forGood ? 1 : 0);
        EXPECT_TRUE(told == "record 1" || told == "resourcesExhausted") << next << ' ' << told;
        EXPECT_EQ(Host::outcomeOf(client, script), "record 1") << next;
      }
    }
  }
}

TEST(Async, ManyThreadsShareAClientAndEachMessageCompletesOnce) {
  Client::Options options = fakeOptions();
  options.messagesPerProcess = 30;
  Client client(options);
  const Sent sent(90);
  std::vector<std::atomic<int>> told(sent.expected.size());
  std::atomic<std::size_t> completed = 0;
  std::vector<std::thread> threads;
  for (std::size_t t = 0; t < 3; ++t) {
    threads.emplace_back([&, t] {
      for (std::size_t i = t; i < told.size(); i += 3) {
        client.start<Response>(sent.requests[i], [&, i](Outcome<Response> outcome) {
          EXPECT_EQ(outcomeOf(outcome), sent.expected[i]) << i;
          ++told[i];
          ++completed;
        });
        EXPECT_EQ(Host::outcomeOf(client, sent.scripts[i]), sent.expected[i]) << i;
      }
    });
    threads.emplace_back([&] { loopUntil(client, [&] { return completed == told.size(); }); });
  }
  for (std::thread& thread : threads) thread.join();
  for (const auto& times : told) EXPECT_EQ(times, 1);
}

TEST(Statistics, CountEveryOutcomeOfEveryKindOfCall) {
  Data rejection;
  Testing::appendReplyFrame(rejection, 0, Protocol::ReplyKind::error,
                            Transport::encodeError(Breach("domain", "type")));
  const std::pair<Data, UInt64 Statistics::*> rows[] = {
      {answer(1), &Statistics::records},
      {Script().write(rejection), &Statistics::rejections},
      {Script().then(Op::raise, SIGSEGV), &Statistics::crashed},
      {Script().then(Op::pause, 60'000), &Statistics::timedOut},
      {Data(1001), &Statistics::messageTooLarge},
      {Script().then(Op::exit, Protocol::resourceExitStatus), &Statistics::resourcesExhausted},
      {Script().answer(Data(3)), &Statistics::protocolViolations}};
  for (const std::size_t allowed : {1U, 100U}) {
    Client::Options options = fakeOptions("honest", milliseconds(500));
    options.largestMessage = 1000;
    options.messagesPerProcess = allowed;
    Client client(options);
    for (std::size_t row = 0; row < std::size(rows); ++row) {
      Host::outcomeOf(client, rows[row].first);
      const Client::Request again[] = {{.message = rows[row].first}};
      client.unpackBatch<Response>(again);
      // It moves with what it has.
      Client moved(std::move(client));
      client = std::move(moved);
      for (std::size_t i = 0; i < std::size(rows); ++i) {
        EXPECT_EQ(client.statistics().*rows[i].second, i <= row ? 2u : 0u) << row << i;
      }
    }
    EXPECT_EQ(client.statistics().messages, 2 * std::size(rows));
  }
}

}  // namespace
}  // namespace Keelgate::Host
