// SPDX-License-Identifier: Apache-2.0
// Workers that were taken over: whatever they do and whenever they end, a message has one outcome
// (C8, C9), in time (C5), no other message is theirs (C6), nor the address layout that they have
// seen (C13), and the next one is served.
#include "framework/contracts/memory_budget.h"
#include "framework/protocol/data_frames.h"
#include "tests/host/host_testing.h"
#include "tests/reply_frame.h"

#include <gtest/gtest.h>

#include <limits>

namespace Keelgate::Host {
namespace {

using Protocol::ReplyHeader;
using Protocol::ReplyKind;

constexpr milliseconds limit(600);
constexpr std::size_t headerSize = sizeof(ReplyHeader);

Data frameOf(Bytes body, ReplyKind kind = ReplyKind::record) {
  Data frame;
  appendReplyFrame(frame, 0, kind, body);
  return frame;
}

/// A frame that announces so many bytes.
Data frameSaying(std::uint64_t length) {
  Data frame = frameOf(recordNumbered(7));
  std::memcpy(frame.data() + offsetof(ReplyHeader, bodyLength), &length, sizeof length);
  return frame;
}

struct Attack {
  String name;
  Data message;
  String outcome;
  UInt64 command = none;
};

std::vector<Attack> attacks() {
  constexpr unsigned forever = 60'000;
  const Data good = frameOf(recordNumbered(7));
  const Bytes whole(good);
  Data twice = good;
  twice.insert(twice.end(), good.begin(), good.end());
  // Read into a buffer of its size, or the byte would have to wait for the next.
  VespCommandResponse response{};
  response.applicationId = String(100'000, 'a');
  Data longer = frameOf(Transport::lendRecord(response).joined());
  longer.push_back({});
  const Data vast = frameSaying(1u << 20);
  const Data large(8u << 20);
  Script talkative;
  for (std::size_t i = 0; i <= Protocol::maximumLogFrames; ++i) talkative.log("a line");
  std::vector<Attack> all{
      {"SIGXCPU", Script().then(Op::raise, SIGXCPU), "timedOut"},
      {"SIGSYS", Script().then(Op::raise, SIGSYS), "crashed"},
      {"a strange exit", Script().then(Op::exit, 3), "crashed"},
      {"no memory", Script().then(Op::exit, Protocol::resourceExitStatus), "resourcesExhausted"},
      {"no seal", Script().then(Op::exit, Protocol::refusedExitStatus), "resourcesExhausted"},
      {"silence", Script().then(Op::pause, forever), "timedOut"},
      {"silence behind a header",
       Script().write(Bytes(vast).first(headerSize)).then(Op::pause, forever), "timedOut"},
      {"bytes that keep coming", Script().write(vast).then(Op::trickle), "timedOut"},
      {"bytes that mean nothing", Script().then(Op::trickle), "protocolViolation"},
      {"endless", Script().then(Op::endless), "protocolViolation"},
      {"a line too many", talkative.answer(7), "protocolViolation"},
      {"a line too long", Script().log(String(Protocol::maximumLogLength + 1, 'x')).answer(7),
       "protocolViolation"},
      {"more than a reply may have", Script().write(frameSaying(1u << 30)), "protocolViolation"},
      {"two answers", Script().write(twice), "protocolViolation"},
      {"a byte behind a long answer", Script().write(longer), "protocolViolation"},
      {"longer than sent", Script().write(frameSaying(good.size() - headerSize + 1)).then(Op::exit),
       "crashed"},
      {"another record", Script().answer(Data(3)), "protocolViolation"},
      {"another kind of error", Script().write(frameOf(Data(1, std::byte{9}), ReplyKind::error)),
       "protocolViolation"},
      // These don't even fit into the channel.
      {"a message that is not read", large, "timedOut", ignoreBody},
      {"an answer before the message", large, "protocolViolation", answerBeforeBody}};
  for (const int signal : {0, SIGKILL, SIGSEGV, SIGSTOP}) {
    const String outcome = signal == SIGSTOP ? "timedOut" : "crashed";
    const auto strike = [&](const char* step, Script script) {
      script.then(signal == 0 ? Op::exit : Op::raise, static_cast<unsigned>(signal));
      all.push_back({step + std::to_string(signal), script, outcome});
    };
    strike("at once, ", Script());
    strike("after a line, ", Script().log("a line"));
    strike("in the header, ", Script().write(whole.first(10)));
    strike("behind the header, ", Script().write(whole.first(headerSize)));
    strike("in the body, ", Script().write(whole.first(headerSize + 20)));
    if (signal == 0) continue;
    all.push_back({"before the message, " + std::to_string(signal), Data(10), outcome,
                   raiseAfterHeader + static_cast<UInt64>(signal)});
  }
  return all;
}

/// Where workers are used again a short message goes with others first.
String outcomeOf(Client& client, const Attack& attack) {
  const Client::Request request[] = {
      {.message = attack.message, .context = {.command = attack.command, .service = "s"}}};
  return Host::outcomeOf(
      [&] { return client.unpackBatch<VespCommandResponse>(request)[0].record().command; });
}

class Hostile : public testing::TestWithParam<std::size_t> {
 protected:
  Client::Options options(Client::Options options) {
    options.messagesPerProcess = GetParam();
    return options;
  }
};

INSTANTIATE_TEST_SUITE_P(Messages, Hostile, testing::Values(1, 100));

TEST_P(Hostile, EveryAttackHasItsOutcomeInTimeAndCostsItsLayout) {
  Client client(options(fakeOptions("honest", limit)));
  std::vector<Attack> all = attacks();
  // An answer to the first message, and not to one that follows it.
  if (GetParam() > 1)
    all.push_back({"early", Script().write(frameOf(recordNumbered(7))), "record 7"});
  for (const Attack& attack : all) {
    const pid_t before = zygoteOf(client);
    const auto start = steady_clock::now();
    EXPECT_EQ(outcomeOf(client, attack), attack.outcome) << attack.name;
    const auto took = steady_clock::now() - start;
    EXPECT_LT(took, limit + milliseconds(1000)) << attack.name;
    EXPECT_TRUE(took >= limit || attack.outcome != "timedOut" || attack.name == "SIGXCPU");
    EXPECT_NE(zygoteOf(client), before) << attack.name;
  }
}

/// Each worker counts the messages that it was given. One that has taken much is not used again:
/// what it was given besides goes to the next.
TEST(C6, AWorkerSeesOneMessageUnlessMoreAreAllowed) {
  const String order = "eat " + std::to_string(allocationLimit(0)) + " 65536";
  const String eats = order + String(200'000, ' ');
  // Among others, which share the worker.
  const String eatsShort = order + String(16'000, ' ');
  const std::tuple<std::size_t, String, std::vector<Int64>> rows[] = {
      {1, "count", {1, 1, 1, 1, 1, 1, 1, 1, 1}},
      {3, "count", {1, 2, 3, 1, 2, 3, 1, 2, 3}},
// A sanitizer's allocator counts for itself.
#ifndef KEELGATE_UNSEALED
      {100, eats, {1, 2, 3, 4, 0, 1, 2, 3, 4}},
      {100, eatsShort, {1, 2, 3, 4, 0, 1, 2, 3, 4}},
#endif
  };
  for (const auto& [allowed, fifth, expected] : rows) {
    Client::Options options = optionsFor(KEELGATE_OBEDIENT_SERVICE, milliseconds(20'000), 1);
    // Far more than any worker can be forked for.
    options.largestMessage = std::numeric_limits<std::size_t>::max();
    options.messagesPerProcess = allowed;
    Client client(options);
    std::vector<Client::Request> requests(9, {.message = bytesOf("count")});
    requests[4].message = bytesOf(fifth);
    std::vector<Int64> counts;
    // The next batch goes on with the worker of the one before.
    const std::span all(requests);
    for (const auto batch : {all.first(2), all.subspan(2)}) {
      for (auto& outcome : client.unpackBatch<VespCommandResponse>(batch)) {
        counts.push_back(outcome.record().messageId.value_or(-1));
      }
    }
    EXPECT_EQ(counts, expected);
  }
}

TEST(C8, LogLinesSteerNoTerminalAndCannotEndTheApplication) {
  const String longest(Protocol::maximumLogLength, 'x');
  Script logs = Script().log("plain,\u00a0Zürich €").log("\x1b[2J\r\n\t\x7f");
  logs.log("\xc2\x9b@A \xff\xc0\x80 \xed\xa0\x80").log(longest).answer(7);
  const String expected =
      "plain,\u00a0Zürich €\n\\x1b[2J\\x0d\\x0a\\x09\\x7f\n"
      "\\xc2\\x9b@A \\xff\\xc0\\x80 \\xed\\xa0\\x80\n" +
      longest + '\n';
  EXPECT_EQ(inFork([&] {
              int ends[2];
              if (pipe2(ends, O_NONBLOCK) != 0 || dup2(ends[1], STDERR_FILENO) < 0) return 2;
              signal(SIGPIPE, SIG_DFL);
              Client::Options options = fakeOptions();
              options.log = nullptr;
              Client client(options);
              if (Host::outcomeOf(client, logs) != "record 7") return 1;
              String seen(2 * expected.size(), '\0');
              seen.resize(static_cast<std::size_t>(read(ends[0], seen.data(), seen.size())));
              if (seen != expected) return 3;
              close(ends[0]);
              return Host::outcomeOf(client, logs) == "record 7" ? 0 : 4;
            }),
            0);
}

}  // namespace
}  // namespace Keelgate::Host
