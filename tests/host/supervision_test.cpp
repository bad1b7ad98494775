// SPDX-License-Identifier: Apache-2.0
// What becomes of services and permits: an abnormal end costs the others nothing (C14).
#include "framework/client/pool.h"
#include "framework/client/stack.h"
#include "tests/host/host_testing.h"

#include <gtest/gtest.h>

#include <pthread.h>

#include <deque>
#include <future>

namespace Keelgate::Host {
namespace {

using std::chrono::seconds;
using Permit = FairSemaphore::Permit;

const Script fault = Script().then(Op::raise, SIGSEGV);

TEST(C14, TheNextMessageFindsAServiceThatWasReady) {
  Client client(fakeOptions());
  // A client that has had two replies is more than a single call.
  EXPECT_TRUE(comesTrue([&] { return zygoteOf(client) > 0 && children().size() == 2; }));
  for (int i = 0; i < 4; ++i) {
    const std::set<pid_t> ready = children();
    EXPECT_EQ(outcomeOf(client, fault), "crashed");
    // Its place, and then that of the standby, is taken at once, and not when somebody asks.
    EXPECT_TRUE(comesTrue([&] { return !std::ranges::includes(ready, children()); }));
    EXPECT_TRUE(ready.contains(zygoteOf(client))) << i;
    EXPECT_TRUE(comesTrue([&] { return zygoteOf(client) > 0 && children().size() == 2; }));
    usleep(100'000);
  }
}

TEST(C14, OthersKeepTheirMessageWhateverEndsBesideThem) {
  // The last one's zygote does not even say what happened, until the others have long been done.
  const Script ends[] = {
      Script().then(Op::pause, 1000).then(Op::raise, SIGSEGV), Script().then(Op::pause, 60'000),
      Script().then(Op::pause, 1000).then(Op::hitZygote, SIGSTOP).then(Op::raise, SIGSEGV)};
  for (const Script& script : ends) {
    Client client(fakeOptions("honest", milliseconds(2000)));
    const int before = zygoteOf(client);
    std::thread other([&] {
      usleep(700'000);
      EXPECT_EQ(outcomeOf(client, Script().then(Op::pause, 1500).answer(9)), "record 9");
    });
    const String outcome = outcomeOf(client, script);
    EXPECT_TRUE(outcome == "crashed" || outcome == "timedOut") << outcome;
    other.join();
    kill(before, SIGCONT);
    EXPECT_NE(zygoteOf(client), before);
  }
}

TEST(C14, GiantsLeaveRoomForSmallMessages) {
  Client client(fakeOptions());
  Script giant = Script().then(Op::pause, 60'000);
  giant.resize(std::size_t{4} << 20);
  const auto never = [](const auto&) {
    ADD_FAILURE();
  };
  for (int i = 0; i < 2; ++i) client.start<VespCommandResponse>({.message = giant}, never);
  client.dispatch();
  EXPECT_EQ(outcomeOf(client, Script().answer(1)), "record 1");
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
  AbnormalEnds ends(1);
  for (const int wait : {0, 0, 0, 0, 1000, 2000, 3000}) {
    EXPECT_EQ(ends.note(now) - now, milliseconds(wait));
  }
  for (int i = 0; i < 100; ++i) EXPECT_LE(ends.note(now) - now, seconds(5));
  // Forgotten when there was peace for long enough.
  EXPECT_EQ(ends.note(now + seconds(6)), now + seconds(6));
  AbnormalEnds unlimited(0);
  for (int i = 0; i < 100; ++i) EXPECT_EQ(unlimited.note(now), now);
}

TEST(Supervision, WhoMakesWorkersFailIsAnsweredLateAndInTime) {
  Client::Options options = fakeOptions("honest", milliseconds(400));
  options.abnormalEndsPerSecond = 1;
  Client client(options);
  for (int i = 0; i < 5; ++i) {
    const auto start = Clock::now();
    EXPECT_EQ(outcomeOf(client, fault), "crashed");
    const auto took = Clock::now() - start;
    EXPECT_LT(took, options.timeLimit + seconds(1));
    EXPECT_TRUE(i < 4 || took >= options.timeLimit);
  }
}

TEST(Supervision, APeakIsForgottenAfterAWhile) {
  const Deadline now = Clock::now();
  RecentPeak peak;
  EXPECT_EQ(peak.value(), 1u);
  const std::tuple<int, std::size_t, std::size_t> rows[] = {{0, 5, 5},  {1, 2, 5},  {2, 3, 5},
                                                            {4, 1, 3},  {6, 1, 1},  {7, 9, 9},
                                                            {20, 2, 2}, {40, 0, 1}, {42, 0, 1}};
  for (const auto& [second, calls, expected] : rows) {
    peak.note(calls, now + seconds(second));
    EXPECT_EQ(peak.value(), expected) << second;
  }
}

TEST(Permits, AreGivenInTurnAndSomeAreKeptForSmallOnes) {
  DescriptorRegistry registry(16);
  FairSemaphore semaphore(2, 1, registry);
  Permit large(semaphore, true);
  Permit secondLarge(semaphore, true);
  Permit small(semaphore, false);
  EXPECT_TRUE(large.isAdmitted() && !secondLarge.isAdmitted() && small.isAdmitted());
  EXPECT_EQ(semaphore.held(), 2u);
  Permit gone(semaphore, false);
  Permit next(semaphore, false);
  // Nobody is called who has left the line, and a permit that comes free goes to the next.
  gone.leave();
  small.leave();
  EXPECT_TRUE(next.isAdmitted() && !secondLarge.isAdmitted());
  large.leave();
  EXPECT_TRUE(secondLarge.isAdmitted());
  EXPECT_EQ(waitFor({.descriptor = secondLarge.descriptor(), .events = POLLIN, .until = {}}),
            POLLIN);
  // Who comes late does not overtake.
  Permit third(semaphore, true);
  Permit last(semaphore, false);
  secondLarge.leave();
  EXPECT_TRUE(third.isAdmitted() && !last.isAdmitted());
  EXPECT_EQ(waitFor({.descriptor = last.descriptor(), .events = POLLIN, .until = {}}), 0);
  // What they wait on is kept for the next, but not for as many as have waited.
  const auto before = openDescriptors();
  {
    std::deque<Permit> many;
    for (int i = 0; i < 10; ++i) many.emplace_back(semaphore, false);
  }
  // Of two one was there, and is not used just now.
  EXPECT_EQ(openDescriptors(), before + 1);
}

// A sanitizer makes frames larger: nothing of this holds there.
#ifndef KEELGATE_UNSEALED

/// The deepest reply that there is, on the least stack that is promised to do.
TEST(Stack, WhatIsPromisedIsEnoughAndLessIsRefused) {
  Client client(fakeOptions());
  PulseUserPayload nested{};
  for (std::size_t i = 0; i < Transport::maximumNesting / 2; ++i) {
    PulseUserPayload outer{};
    outer.ostrelMessageList.push_back(std::move(nested));
    nested = std::move(outer);
  }
  const Script deepest = Script().answer(Transport::lendRecord(nested).joined());
  const auto runWith = [&](std::size_t stack) {
    pthread_attr_t attributes;
    pthread_attr_init(&attributes);
    pthread_attr_setstacksize(&attributes, stack);
    EXPECT_EQ(pthread_setattr_default_np(&attributes), 0);
    pthread_attr_destroy(&attributes);
    return std::async(
               std::launch::async,
               [&] {
                 return outcomeOf([&] { return client.unpack<PulseUserPayload>(deepest).command; });
               })
        .get();
  };
  // In this order: the C library gives a thread the stack of one before it that had more.
  EXPECT_EQ(runWith(minimumStack - (32u << 10)), "resourcesExhausted");
  EXPECT_EQ(runWith(minimumStack + (32u << 10)), "record 0");
}
#endif

}  // namespace
}  // namespace Keelgate::Host
