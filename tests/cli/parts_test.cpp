// SPDX-License-Identifier: Apache-2.0
// The parts of the command that need no service: request lines, suggestions and ordered work.
#include "cli/nearest.h"
#include "cli/ordered_work.h"
#include "cli/request_line.h"
#include "cli/table.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <semaphore>
#include <thread>
#include <utility>

namespace Keelgate::CLI {
namespace {

/// "ok", or why the line is not a request.
String problemOf(const RequestLine& line) {
  const auto* problem = std::get_if<String>(&line.content);
  return problem == nullptr ? "ok" : *problem;
}

struct LineCase {
  std::string_view line;
  /// A part of the problem.
  const char* problem;
  Optional<String> id;
};

TEST(RequestLine, IsReadStrictly) {
  constexpr auto absent = std::nullopt;
  using namespace std::string_view_literals;
  std::vector<LineCase> table = {
      {R"({"record":"VespInvitation","message":""})", "ok", absent},
      {" {\"id\" : null ,\t\"message\":\"Zg==\",\"command\":0,\"service\":\"\"} \r", "ok", "null"},
      {R"({"service":"s","command":18446744073709551615,"message":"","id":{"b":[1.0,-0,1e5],"a":"\u00e9"}})",
       "ok", R"({"b":[1.0,-0,1e5],"a":"\u00e9"})"},
      {R"({"record":"VespInvitation","message":"","id":123456789012345678901234567890.10})", "ok",
       "123456789012345678901234567890.10"},
      {R"({"id":1})", "neither", "1"},
      {R"({"record":"VespInvitation","id":1})", "\"message\" is missing", "1"},
      {R"({"record":"VespClientMessageResult","message":"","id":1})", "unknown record", "1"},
      {R"({"record":"VespInvitation","command":1,"message":"","id":1})", "excludes", "1"},
      {R"({"record":"VespInvitation","service":"","message":"","id":1})", "excludes", "1"},
      {R"({"record":"VespInvitation","typed":true,"message":"","id":1})", "belongs to", "1"},
      {R"({"service":"s","command":1,"typed":true,"message":"","id":1})", "\"typed\" needs", "1"},
      {R"({"record":5,"message":"","id":1})", "\"record\" must be a string", "1"},
      {R"({"record":{"id":2},"message":"","id":1})", "\"record\" must be a string", "1"},
      {R"({"service":"s","message":""})", "needs \"command\"", absent},
      {R"({"command":1,"message":""})", "needs \"service\"", absent},
      {R"({"service":"s","command":"1","message":""})", "must be a number", absent},
      {R"({"service":"s","message":"","command":-1})", "must be an integer", absent},
      {R"({"service":"s","message":"","command":1.0})", "must be an integer", absent},
      {R"({"service":"s","message":"","command":18446744073709551616})", "must be an integer",
       absent},
      {R"({"record":"VespInvitation","message":"Zg"})", "not base64", absent},
      {R"({"record":"VespInvitation","message":"","extra":[{"id":7}],"id":[]})", "unknown key",
       "[]"},
      {R"({"record":"VespInvitation","record":"VespInvitation","message":"","id":1})",
       "stands twice", "1"},
      {R"({"record":"VespInvitation","message":"","id":1,"id":2})", "stands twice", absent},
      {"[]", "object", absent},
      {"{\"id\":1}\0x"sv, "more than one value", absent},
      {R"({"id":["\udc00","\u0041\" ", [ ], { } ,1E400 ],"record":"VespInvitation","message":""})",
       "ok", R"(["\udc00","\u0041\" ",[],{},1E400])"},
      {"{\"id\":\"\x7f\u009b\u2028\\n\u00e9\",\"record\":\"VespInvitation\",\"message\":\"\"}",
       "ok", "\"\\u007f\\u009b\\u2028\\n\u00e9\""},
      {"{\"id\":\"0123456789012345678901234567890\x1f\"}", "control character", absent},
  };
  for (const char* line : {"", "\r", R"({"id":1)", R"({"id":1} {})", "{\"id\":\"\xff\"}",
                           R"({"id":NaN})", R"({"id":1,})", R"({"id":[1,]})", R"({"id":[1}})",
                           R"({"id":{"a":1,}})", R"({"id":{"a" 1}})", R"({"id":01})"}) {
    table.push_back({line, "not readable", absent});
  }
  // Which takes no stack.
  const String nest = String(1'000'000, '[') + String(1'000'000, ']');
  const String nested = R"({"record":"VespInvitation","message":"","id":)" + nest + "}";
  table.push_back({nested, "ok", nest});
  for (const LineCase& entry : table) {
    String text(entry.line);
    const RequestLine line = readRequestLine(text);
    EXPECT_NE(problemOf(line).find(entry.problem), String::npos) << entry.line << problemOf(line);
    EXPECT_EQ(line.id, entry.id) << entry.line;
  }
}

TEST(RequestLine, AStringStandsForItsCharacters) {
  const auto lineOf = [](const char* spelt) {
    return String(R"({"service":")") + spelt + R"(","command":7,"message":"Zm9v"})";
  };
  const std::pair<const char*, const char*> table[] = {
      {R"(a\"\\\/\b\f\n\r\tz)", "a\"\\/\b\f\n\r\tz"},
      {R"(\u0041\u00e9\u20AC\ud7ff\ue000)", "A\u00e9\u20ac\ud7ff\ue000"},
      {R"(\ud800\udc00\uDBFF\uDFFF!)", "\U00010000\U0010ffff!"}};
  for (const auto& [spelt, text] : table) {
    String line = lineOf(spelt);
    const RequestLine read = readRequestLine(line);
    ASSERT_EQ(problemOf(read), "ok") << spelt;
    const auto& request = std::get<StreamRequest>(read.content);
    const auto& context = std::get<VespClientMessageContext>(request.subject);
    EXPECT_TRUE(context.service == text && context.command == 7) << spelt;
    EXPECT_TRUE(std::ranges::equal(request.message, std::as_bytes(std::span("foo", 3))));
  }
  const std::pair<const char*, std::vector<const char*>> refused[] = {
      {"half of a surrogate pair",
       {R"(\ud800)", R"(\ud800x)", R"(\ud800\n)", R"(\ud800\udbff)", R"(\udfff)", R"(\ud800\ue000)",
        R"(\udc00\udc00)", R"(\ud7ff\udc00)"}},
      {"not an escape", {R"(\x)", R"(\u12g4)", R"(\u123)", R"(\U0041)", R"(\u-123)"}}};
  for (const auto& [problem, all] : refused) {
    for (const char* spelt : all) {
      String line = lineOf(spelt);
      EXPECT_NE(problemOf(readRequestLine(line)).find(problem), String::npos) << spelt;
    }
  }
}

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
