// SPDX-License-Identifier: Apache-2.0
// What becomes of services and places: an abnormal end costs its message, its worker and the
// address layout (C13), and the others nothing (C14).
#include "framework/client/pool.h"
#include "framework/client/stack.h"
#include "framework/protocol/data_frames.h"
#include "tests/host/host_testing.h"

#include <gtest/gtest.h>

#include <pthread.h>

#include <algorithm>
#include <csignal>
#include <thread>

namespace Keelgate::Host {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;
using Place = FairSemaphore::Place;
using State = ServiceProcess::State;

const Script zygote = Script().then(Op::answerZygote);

/// The process that the workers of a client are forked from just now.
int zygoteOf(Client& client) {
  return static_cast<int>(client.unpack<VespCommandResponse>(zygote).command);
}

template <class Condition>
bool comesTrue(Condition condition) {
  for (int i = 0; i < 500; ++i) {
    if (condition()) return true;
    usleep(10'000);
  }
  return false;
}

/// More than a single call, and time for what is started behind them to get ready.
void settle(Client& client) {
  for (int i = 0; i < 3; ++i) zygoteOf(client);
  ASSERT_TRUE(comesTrue([] { return children().size() >= 2; }));
  usleep(100'000);
}

TEST(C13, EveryAbnormalEndCostsTheLayout) {
  const std::pair<Script, const char*> ends[] = {
      {Script().then(Op::raise, SIGSEGV), "crashed"},
      {Script().then(Op::raise, SIGXCPU), "timedOut"},
      {Script().then(Op::exit, 0), "crashed"},
      {Script().then(Op::exit, 3), "crashed"},
      {Script().then(Op::exit, Protocol::resourceExitStatus), "resourcesExhausted"},
      {Script().then(Op::exit, Protocol::refusedExitStatus), "resourcesExhausted"},
      {Script().write(Data(64)), "protocolViolation"},
      {Script().answer(Data(3)), "protocolViolation"},
      {Script().then(Op::pause, 60'000), "timedOut"},
      {Script().then(Op::trickle, 60'000), "protocolViolation"}};
  Client::Options options = fakeOptions();
  options.timeLimit = milliseconds(1500);
  for (const std::size_t reuse : {1u, 100u}) {
    options.messagesPerProcess = reuse;
    Client client(options);
    for (const auto& [script, outcome] : ends) {
      const int before = zygoteOf(client);
      EXPECT_EQ(outcomeOf(client, script), outcome);
      EXPECT_NE(zygoteOf(client), before) << outcome;
    }
  }
}

/// It had answered: its message is not lost, but what it does next is no accident.
TEST(C13, AnEndBehindTheAnswerCostsTheLayoutToo) {
  Client client(fakeOptions());
  const int before = zygoteOf(client);
  EXPECT_EQ(outcomeOf(client, Script().answer(recordNumbered(1)).then(Op::raise, SIGSEGV)),
            "record 1");
  EXPECT_TRUE(comesTrue([&] { return zygoteOf(client) != before; }));
}

TEST(C14, TheNextMessageFindsAServiceThatWasReady) {
  Client client(fakeOptions());
  settle(client);
  for (int i = 0; i < 3; ++i) {
    const int old = zygoteOf(client);
    const std::set<int> ready = children();
    EXPECT_EQ(outcomeOf(client, Script().then(Op::raise, SIGSEGV)), "crashed");
    const int next = zygoteOf(client);
    EXPECT_NE(next, old);
    EXPECT_TRUE(ready.contains(next)) << i;
    // Its end is nobody's business, but it comes.
    EXPECT_TRUE(comesTrue([&] { return zygoteOf(client) == next && !children().contains(old); }));
    settle(client);
  }
}

TEST(C14, OthersKeepTheirMessageWhateverEndsBesideThem) {
  // The last one's zygote does not even say what happened, until the others have long been done.
  const Script ends[] = {
      Script().then(Op::pause, 1000).then(Op::raise, SIGSEGV), Script().then(Op::pause, 60'000),
      Script().then(Op::pause, 1000).then(Op::hitZygote, SIGSTOP).then(Op::raise, SIGSEGV)};
  for (const Script& script : ends) {
    Client::Options options = fakeOptions();
    options.timeLimit = milliseconds(2000);
    Client client(options);
    const int before = zygoteOf(client);
    std::thread other([&] {
      usleep(700'000);
      const Script slow = Script().then(Op::pause, 1500).answer(recordNumbered(9));
      EXPECT_EQ(outcomeOf(client, slow), "record 9");
    });
    const String outcome = outcomeOf(client, script);
    EXPECT_TRUE(outcome == "crashed" || outcome == "timedOut") << outcome;
    other.join();
    kill(before, SIGCONT);
    EXPECT_NE(zygoteOf(client), before);
  }
}

/// Each death before a first answer doubles the wait, and an answer ends that.
TEST(C14, AZygoteThatDiesIsReplacedAtOnceAsLongAsAnswersCome) {
  Client client(fakeOptions());
  const auto start = Clock::now();
  for (int i = 0; i < 6; ++i) {
    const String old = outcomeOf(client, zygote);
    kill(zygoteOf(client), SIGKILL);
    // Its workers may outlive it for a moment.
    EXPECT_TRUE(comesTrue([&] {
      const String next = outcomeOf(client, zygote);
      return next.starts_with("record") && next != old;
    }));
  }
  EXPECT_LT(Clock::now() - start, seconds(8));
}

TEST(C5, BytesThatKeepComingDoNotKeepTheClient) {
  Client::Options options = fakeOptions();
  options.timeLimit = milliseconds(300);
  Client client(options);
  const Data body(std::size_t{1} << 20);
  Data frame;
  Protocol::appendReplyFrame(frame, 0, Protocol::ReplyKind::record, body);
  frame.resize(100);
  const auto start = Clock::now();
  EXPECT_EQ(outcomeOf(client, Script().write(frame).then(Op::trickle, 5000)), "timedOut");
  EXPECT_LT(Clock::now() - start, options.timeLimit + seconds(1));
}

class Supervised : public testing::Test {
 protected:
  Supervisor::Service running() {
    for (;;) {
      auto service = supervisor_.demand(deadlineAfter(seconds(10)));
      if (const Wait* wait = std::get_if<Wait>(&service)) {
        waitFor(*wait);
      } else {
        return std::get<Supervisor::Service>(service);
      }
    }
  }

  DescriptorRegistry registry_{64};
  Supervisor supervisor_{{.path = fakeService(),
                          .socket = {},
                          .socketUser = {},
                          .requireLayers = false,
                          .messagesPerWorker = 1,
                          .cpuSecondsPerWorker = 5,
                          .maximumWorkers = 3},
                         [](std::string_view) {},
                         registry_};
};

TEST_F(Supervised, ALayoutIsGivenUpAfterSoManyReplies) {
  const Supervisor::Service first = running();
  EXPECT_TRUE(supervisor_.isCurrent(first.get()));
  for (std::uint64_t i = 1; i < repliesPerLayout; ++i) supervisor_.noteReply(*first);
  supervisor_.tidy();
  EXPECT_EQ(first->state(), State::running);
  EXPECT_TRUE(comesTrue([&] {
    supervisor_.noteReply(*first);
    return first->state() == State::retired;
  }));
  EXPECT_NE(running(), first);
  EXPECT_FALSE(supervisor_.isCurrent(first.get()));
}

TEST_F(Supervised, AServiceHasSoManyWorkersAtATime) {
  const Supervisor::Service service = running();
  std::vector<Optional<ServiceProcess::Forked>> forked;
  for (int i = 0; i < 3; ++i) forked.push_back(service->fork(1000));
  for (const auto& worker : forked) ASSERT_TRUE(worker);
  EXPECT_FALSE(service->fork(1000));
  // Its slot is free when its end is known, and not before.
  service->release(forked[1]->slot, ServiceProcess::Leaving::killed);
  EXPECT_TRUE(comesTrue([&] {
    service->readNews();
    return service->fork(1000).has_value();
  }));
  EXPECT_EQ(service->state(), State::running);
}

TEST(Supervision, AServiceThatCannotLiveIsTriedLessAndLess) {
  BackOff backOff;
  for (int round = 0; round < 2; ++round) {
    for (const int wait : {0, 10, 100, 1000, 10'000, 60'000, 60'000}) {
      const Deadline before = Clock::now();
      backOff.noteDeath();
      EXPECT_GE(backOff.notBefore(), before + milliseconds(wait));
      EXPECT_LE(backOff.notBefore(), Clock::now() + milliseconds(wait));
    }
    backOff.noteGoodReply();
  }
}

TEST(Supervision, AbnormalEndsAreSpacedOut) {
  const Deadline now = Clock::now();
  AbnormalEnds ends(10);
  for (const int wait : {0, 0, 0, 0, 100, 200, 300}) {
    EXPECT_EQ(ends.note(now) - now, milliseconds(wait));
  }
  for (int i = 0; i < 100; ++i) EXPECT_LE(ends.note(now) - now, seconds(5));
  // Forgotten when there was peace for long enough.
  EXPECT_EQ(ends.note(now + seconds(6)), now + seconds(6));
  AbnormalEnds unlimited(0);
  for (int i = 0; i < 100; ++i) EXPECT_EQ(unlimited.note(now), now);
}

TEST(Supervision, WhoMakesWorkersFailIsAnsweredLateAndInTime) {
  Client::Options options = fakeOptions();
  options.abnormalEndsPerSecond = 1;
  options.timeLimit = milliseconds(400);
  Client client(options);
  const Script dies = Script().then(Op::raise, SIGSEGV);
  for (int i = 0; i < 4; ++i) EXPECT_EQ(outcomeOf(client, dies), "crashed");
  const auto start = Clock::now();
  EXPECT_EQ(outcomeOf(client, dies), "crashed");
  EXPECT_GE(Clock::now() - start, options.timeLimit);
  EXPECT_LT(Clock::now() - start, options.timeLimit + seconds(1));
}

TEST(Supervision, APeakIsForgottenAfterAWhile) {
  const Deadline now = Clock::now();
  RecentPeak peak;
  EXPECT_EQ(peak.value(), 1u);
  const std::tuple<int, std::size_t, std::size_t> rows[] = {
      {0, 5, 5}, {1, 2, 5}, {2, 3, 5}, {4, 1, 3}, {6, 1, 1}, {7, 9, 9}, {20, 2, 2}};
  for (const auto& [second, calls, expected] : rows) {
    peak.note(calls, now + seconds(second));
    EXPECT_EQ(peak.value(), expected) << second;
  }
}

TEST(Places, AreGivenInTurnAndSomeAreKeptForSmallOnes) {
  DescriptorRegistry registry(16);
  FairSemaphore semaphore(2, 1, registry);
  Place large(semaphore, true);
  Place secondLarge(semaphore, true);
  Place small(semaphore, false);
  EXPECT_TRUE(large.isAdmitted() && !secondLarge.isAdmitted() && small.isAdmitted());
  EXPECT_EQ(semaphore.held(), 2u);
  Place gone(semaphore, false);
  Place next(semaphore, false);
  // Nobody is called who has left the line, and a place that comes free goes to the next.
  gone.leave();
  small.leave();
  EXPECT_TRUE(next.isAdmitted() && !secondLarge.isAdmitted());
  large.leave();
  EXPECT_TRUE(secondLarge.isAdmitted());
  EXPECT_EQ(waitFor({.descriptor = secondLarge.descriptor(), .events = POLLIN, .until = {}}),
            POLLIN);
  // Who comes late does not overtake.
  Place third(semaphore, true);
  Place last(semaphore, false);
  secondLarge.leave();
  EXPECT_TRUE(third.isAdmitted() && !last.isAdmitted());
  EXPECT_EQ(waitFor({.descriptor = last.descriptor(), .events = POLLIN, .until = {}}), 0);
}

// A sanitizer makes frames larger: nothing of this holds there.
#ifndef KEELGATE_UNSEALED

/// So many payloads, each the only element of the list before it.
Data nestedPayloads(std::size_t depth) {
  PulseUserPayload payload{};
  const Data flat = Transport::encodeRecord(payload);
  payload.ostrelMessageList.emplace_back(PulseUserPayload{});
  const Data one = Transport::encodeRecord(payload);
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

struct StackTrial {
  Client& client;
  Data reply;
  String outcome;

  static void* run(void* trial) {
    StackTrial& self = *static_cast<StackTrial*>(trial);
    self.outcome = outcomeOf(
        [&] { return self.client.unpack<PulseUserPayload>(Script().answer(self.reply)).command; });
    return nullptr;
  }
  void runWith(std::size_t stack) {
    pthread_attr_t attributes;
    pthread_attr_init(&attributes);
    pthread_attr_setstacksize(&attributes, stack);
    pthread_t thread;
    ASSERT_EQ(pthread_create(&thread, &attributes, run, this), 0);
    pthread_join(thread, nullptr);
    pthread_attr_destroy(&attributes);
  }
};

/// The deepest reply that there is, on the least stack that is promised to do.
TEST(Stack, WhatIsPromisedIsEnoughAndLessIsRefused) {
  Client client(fakeOptions());
  StackTrial trial{client, nestedPayloads(1 + Transport::maximumNesting / 2), {}};
  // In this order: the C library gives a thread the stack of one before it that had more.
  trial.runWith(leastStack - (32u << 10));
  EXPECT_EQ(trial.outcome, "resourcesExhausted");
  trial.runWith(leastStack + (32u << 10));
  EXPECT_EQ(trial.outcome, "record 0");
}
#endif

}  // namespace
}  // namespace Keelgate::Host
