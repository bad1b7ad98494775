// SPDX-License-Identifier: Apache-2.0
// The parts of the command that need no service: suggestions, tables and ordered work.
#include "cli/nearest.h"
#include "cli/ordered_work.h"
#include "cli/table.h"

#include <gtest/gtest.h>

#include <atomic>
#include <semaphore>
#include <thread>
#include <utility>

namespace Keelgate::CLI {
namespace {

TEST(Suggestion, IsWhatAThirdOfTheNameMayBeMistypedFor) {
  const std::tuple<Array<std::string_view>, const char*, const char*> table[] = {
      {{"check", "unpack"}, "unpak", "did you mean unpack?"},
      {{"saturday", "sunday"}, "sunday", "did you mean sunday?"},
      {{"sunday", "sitting"}, "saturday", "did you mean sunday?"},
      {{"sitting"}, "kitten", "nothing"},
      {{"sitting"}, "kittens", "did you mean sitting?"},
      {{"abc"}, "xbz", "nothing"},
      {{"aabb", "aaab", "aaac", "aaaa"}, "aaaa", "did you mean aaaa or aaab or aaac?"},
      {{"describe"}, "des", "did you mean describe?"},
      {{"describe"}, "de", "nothing"},
      {{}, "x", "nothing"}};
  for (const auto& [names, name, said] : table) {
    EXPECT_EQ(suggestion(names, name, "nothing"), said);
  }
}

TEST(Table, BreaksItsLastColumnWhereThatLeavesRoomForSomeWords) {
  Table words({"N", "T"});
  words.add({"x", "aaaa bbbb cccc dddd eeee ffff gggg hhhh"});
  EXPECT_EQ(words.text(35, false),
            "  N  T\n  x  aaaa bbbb cccc dddd eeee ffff\n         gggg hhhh\n");
  EXPECT_EQ(words.text(34, false), "  N  T\n  x  aaaa bbbb cccc dddd eeee ffff\n      gggg hhhh\n");
}

using Job = OrderedWork::Job;
using Due = std::vector<JSON::Reply>;

/// A job of one reply.
template <class MakeReply>
Job jobOf(std::size_t weight, MakeReply reply) {
  return {.next = [=, isMade = false]() mutable -> Optional<JSON::Reply> {
            if (std::exchange(isMade, true)) return std::nullopt;
            return reply();
          },
          .weight = weight};
}

/// The jobs for the numbers below `count`.
template <class MakeJob>
OrderedWork::Source jobs(int count, MakeJob make) {
  return [=, next = 0]() mutable -> Optional<Job> {
    if (next == count) return std::nullopt;
    return make(next++);
  };
}

constexpr std::size_t large = std::size_t{48} << 20;

/// Gives other threads so many turns that they get as far as they can.
void letOthersRun() {
  for (int turn = 0; turn < 10'000; ++turn) std::this_thread::yield();
}

TEST(OrderedWork, WhatWaitsIsBoundedInBytesAndGivenBack) {
  struct Case {
    int mostTaken;
    std::size_t request, reply;
  };
  // Whether it is the requests that fill the window or the replies: each thread may be in the
  // middle of a job when it is full, and nothing else is taken then.
  for (const Case& row : {Case{2, large, 1}, Case{4, 1, large}}) {
    constexpr int threads = 3, count = 20;
    std::binary_semaphore go(0);
    std::atomic<int> taken = 0;
    std::size_t bytes = 0;
    OrderedWork work([&](const Due& due, Bool) {
      for (const JSON::Reply& reply : due) bytes += JSON::sizeOf(reply.json);
      return true;
    });
    std::thread running([&] {
      work.run(threads, jobs(count, [&](int job) {
                 ++taken;
                 return jobOf(row.request, [&go, job, reply = row.reply] {
                   if (job == 0 || reply == 1) {
                     go.acquire();
                     go.release();
                   }
                   return JSON::Reply{.json = {String(reply, 'x')}};
                 });
               }));
    });
    while (taken == 0) std::this_thread::yield();
    letOthersRun();
    EXPECT_LE(taken, row.mostTaken);
    go.release();
    running.join();
    EXPECT_EQ(taken, count);
    EXPECT_EQ(bytes, row.reply * count);
  }
}

TEST(OrderedWork, AJobWithoutMemoryEndsTheWorkAndNotTheProgram) {
  OrderedWork work([](const Due&, Bool) { return true; });
  const auto job = [](int) {
    return jobOf(1, []() -> JSON::Reply { throw std::bad_alloc(); });
  };
  EXPECT_THROW(work.run(2, jobs(1000, job)), std::bad_alloc);
}

}  // namespace
}  // namespace Keelgate::CLI
