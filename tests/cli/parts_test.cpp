// SPDX-License-Identifier: Apache-2.0
// The parts of the command that need no service: request lines, ordered work, tables.
#include "cli/ordered_work.h"
#include "cli/request_line.h"
#include "cli/table.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <latch>
#include <numeric>
#include <semaphore>

namespace Keelgate::CLI {
namespace {

/// "ok", or why the line is no request.
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

TEST(RequestLine, isReadStrictly) {
  constexpr auto absent = std::nullopt;
  using namespace std::string_view_literals;
  const LineCase table[] = {
      {R"({"record":"VespInvitation","message":""})", "ok", absent},
      {" {\"id\" : null ,\t\"message\":\"Zg==\",\"command\":0,\"service\":\"\"} \r", "ok", "null"},
      {R"({"service":"s","command":18446744073709551615,"message":"","id":{"b":[1.0,-0,1e5],"a":"\u00e9"}})",
       "ok", "{\"b\":[1.0,-0,1e5],\"a\":\"\u00e9\"}"},
      {R"({"record":"VespInvitation","message":"","id":123456789012345678901234567890.10})", "ok",
       "123456789012345678901234567890.10"},
      {R"({"id":1})", "neither", "1"},
      {R"({"record":"VespInvitation","id":1})", "\"message\" is missing", "1"},
      {R"({"record":"VespClientMessageResult","message":"","id":1})", "unknown record", "1"},
      {R"({"record":"VespInvitation","command":1,"message":"","id":1})", "excludes", "1"},
      {R"({"record":"VespInvitation","service":"","message":"","id":1})", "excludes", "1"},
      {R"({"record":5,"message":"","id":1})", "\"record\" must be a string", "1"},
      {R"({"record":{"id":2},"message":"","id":1})", "\"record\" must be a string", "1"},
      {R"({"service":"s","message":""})", "needs \"command\"", absent},
      {R"({"command":1,"message":""})", "needs \"service\"", absent},
      {R"({"service":"s","command":"1","message":""})", "must be a number", absent},
      {R"({"service":"s","command":-1,"message":""})", "must be an integer", absent},
      {R"({"service":"s","command":1.0,"message":""})", "must be an integer", absent},
      {R"({"service":"s","command":1e0,"message":""})", "must be an integer", absent},
      {R"({"service":"s","command":18446744073709551616,"message":""})", "integer", absent},
      {R"({"record":"VespInvitation","message":"Zg"})", "no base64", absent},
      {R"({"record":"VespInvitation","message":"","extra":[{"id":7}],"id":[]})", "unknown key",
       "[]"},
      {R"({"record":"VespInvitation","record":"VespInvitation","message":"","id":1})",
       "stands twice", "1"},
      {R"({"record":"VespInvitation","message":"","id":1,"id":2})", "stands twice", absent},
      {"", "not readable", absent},
      {"\r", "not readable", absent},
      {"[]", "object", absent},
      {"3", "object", absent},
      {R"({"id":1)", "not readable", absent},
      {R"({"id":1} {})", "not readable", absent},
      {"{\"id\":1}\0x"sv, "null character", absent},
      {"{\"id\":\"\xff\"}", "not readable", absent},
      {R"({"id":"\udc00","record":"VespInvitation","message":""})", "surrogate", absent},
      {R"({"id":NaN})", "not readable", absent},
      {R"({"id":1,})", "not readable", absent},
  };
  for (const LineCase& entry : table) {
    const RequestLine line = readRequestLine(entry.line);
    EXPECT_NE(problemOf(line).find(entry.problem), String::npos) << entry.line << problemOf(line);
    EXPECT_EQ(line.id, entry.id) << entry.line;
  }
}

TEST(RequestLine, nestingOfAnyDepthTakesNoStack) {
  const String nest = String(1'000'000, '[') + String(1'000'000, ']');
  const RequestLine line =
      readRequestLine(R"({"record":"VespInvitation","message":"","id":)" + nest + "}");
  EXPECT_EQ(problemOf(line), "ok");
  EXPECT_TRUE(line.id == nest);
}

Reply numbered(int number) {
  return {.json = std::to_string(number), .verdict = Verdict::record, .problem = {}};
}

TEST(OrderedWork, repliesComeInOrderHoweverJobsEnd) {
  constexpr int jobs = 500, threads = 8;
  Array<String> out;
  std::latch others(threads - 1);
  {
    OrderedWork work(threads, [&](const Reply& reply) {
      out.push_back(reply.json);
      return true;
    });
    for (int i = 0; i < jobs; ++i) {
      // The first is the last to end: all other threads pass it.
      const auto job = [&others, i] {
        if (i == 0) others.wait();
        if (i > 0 && i < threads) others.count_down();
        return numbered(i);
      };
      ASSERT_TRUE(work.add(job, 1));
    }
    work.finish();
  }
  ASSERT_EQ(out.size(), std::size_t{jobs});
  for (int i = 0; i < jobs; ++i) EXPECT_EQ(out[static_cast<std::size_t>(i)], std::to_string(i));
}

TEST(OrderedWork, whatWaitsIsBounded) {
  constexpr std::size_t large = std::size_t{48} << 20;
  std::binary_semaphore go(0);
  std::atomic<int> started = 0, added = 0;
  OrderedWork work(4, [](const Reply&) { return true; });
  std::thread adding([&] {
    for (int i = 0; i < 3; ++i) {
      const auto job = [&] {
        ++started;
        go.acquire();
        go.release();
        return numbered(0);
      };
      work.add(job, large);
      ++added;
    }
  });
  while (started == 0) std::this_thread::yield();
  // Two of them are more than may wait, so the second is not taken while the first is in work,
  // however often the other thread gets its turn.
  for (int turn = 0; turn < 10'000; ++turn) std::this_thread::yield();
  EXPECT_LE(added, 1);
  go.release();
  adding.join();
  work.finish();
  EXPECT_EQ(started, 3);
}

TEST(OrderedWork, endsWithItsReader) {
  int seen = 0;
  OrderedWork work(3, [&](const Reply&) { return ++seen < 10; });
  int added = 0;
  while (work.add([] { return numbered(0); }, 1)) ++added;
  work.finish();
  EXPECT_EQ(seen, 10);
  EXPECT_GE(added, 10);
}

TEST(Table, fitsAnyWidthAndLosesNothing) {
  const Array<String> cells = {"averylongnamewithoutanyspace", "several words that can be broken",
                               "short"};
  for (std::size_t width = 30; width < 100; ++width) {
    Table table({"NAME", "TEXT", "END"}, width, false);
    table.add(cells);
    String text = table.text();
    for (std::size_t begin = 0; begin < text.size();) {
      const std::size_t end = text.find('\n', begin);
      EXPECT_LE(end - begin, width);
      EXPECT_NE(text[end - 1], ' ');
      begin = end + 1;
    }
    const auto letters = [](const String& all) {
      return std::ranges::count_if(all, [](char c) { return c != ' ' && c != '\n'; });
    };
    EXPECT_EQ(letters(text),
              letters("NAMETEXTEND" + std::accumulate(cells.begin(), cells.end(), String())));
  }
}

}  // namespace
}  // namespace Keelgate::CLI
