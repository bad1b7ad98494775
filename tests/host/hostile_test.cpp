// SPDX-License-Identifier: Apache-2.0
// Workers that were taken over: whatever they do, a message has one outcome (C8), in time (C5), no
// other message is theirs (C6), and the next one is served.
#include "framework/client/deadline.h"
#include "framework/transport/error_coding.h"
#include "tests/host/host_testing.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <sys/wait.h>

#include <algorithm>
#include <csignal>
#include <cstddef>
#include <limits>

namespace Keelgate::Host {
namespace {

using Protocol::ReplyHeader;
using Protocol::ReplyKind;
using std::chrono::milliseconds;
using Transport::MalformedReply;

ReplyHeader headerFor(Bytes body, ReplyKind kind = ReplyKind::record) {
  return {Protocol::magic, Protocol::protocolVersion, kind, 0, 0, body.size()};
}

/// An answer with one thing wrong in its header.
template <class Change>
Script withHeader(Change change) {
  const Data body = recordNumbered(7);
  ReplyHeader header = headerFor(body);
  change(header);
  return Script().frame(header, body);
}

Script withBody(const Data& body) {
  return Script().frame(headerFor(body), body);
}

Data changed(Data body, std::size_t at, std::uint8_t to) {
  body.at(at) = std::byte{to};
  return body;
}

Script chatter(std::size_t frames, std::size_t length) {
  Script script;
  for (std::size_t i = 0; i < frames; ++i) script.log(String(length, 'x'));
  return script.answer(recordNumbered(7));
}

struct Attack {
  const char* name;
  Script script;
  const char* outcome;
};

std::vector<Attack> attacks() {
  const Data good = recordNumbered(7);
  Data longer = good;
  longer.push_back(std::byte{0});
  Data twice;
  for (int i = 0; i < 2; ++i) {
    const ReplyHeader header = headerFor(good);
    const Bytes head = std::as_bytes(std::span(&header, 1));
    twice.insert(twice.end(), head.begin(), head.end());
    twice.insert(twice.end(), good.begin(), good.end());
  }
  const Data unknownError{std::byte{9}};
  // command, then a flag for each of messageId, messageUUID, responseStatus, failReason, token, two
  // booleans, and the text.
  constexpr std::size_t firstFlag = 8, textLength = 16, text = 24;
  return {
      {"honest", Script().answer(good), "record 7"},
      {"honest with all the log lines", chatter(8, 512), "record 7"},
      {"nothing", Script(), "crashed"},
      {"half a header", Script().write(Bytes(twice).first(10)), "crashed"},
      {"half a body", Script().write(Bytes(twice).first(40)), "crashed"},
      {"no magic", withHeader([](auto& h) { h.magic = 0; }), "protocolViolation"},
      {"other version", withHeader([](auto& h) { h.version += 1; }), "protocolViolation"},
      {"no kind", withHeader([](auto& h) { h.kind = ReplyKind{}; }), "protocolViolation"},
      {"other sequence", withHeader([](auto& h) { h.sequence = 1; }), "protocolViolation"},
      {"last", withHeader([](auto& h) { h.last = 2; }), "protocolViolation"},
      {"huge", withHeader([](auto& h) { h.bodyLength = ~0ull; }), "protocolViolation"},
      {"long", withHeader([](auto& h) { h.bodyLength = 4u << 20; }), "protocolViolation"},
      {"longer than sent", withHeader([](auto& h) { h.bodyLength += 1; }), "crashed"},
      {"shorter than sent", withHeader([](auto& h) { h.bodyLength -= 1; }), "protocolViolation"},
      {"an error as a record", withHeader([](auto& h) { h.kind = ReplyKind::error; }),
       "protocolViolation"},
      {"error of no kind", Script().frame(headerFor(unknownError, ReplyKind::error), unknownError),
       "protocolViolation"},
      {"too many log lines", chatter(9, 1), "protocolViolation"},
      {"too long a log line", chatter(1, 513), "protocolViolation"},
      {"two answers", Script().write(twice), "protocolViolation"},
      {"endless", Script().then(Op::endless), "protocolViolation"},
      {"flag that is none", withBody(changed(good, firstFlag, 2)), "protocolViolation"},
      {"text beyond the end", withBody(changed(good, textLength, 0xff)), "protocolViolation"},
      {"no UTF-8", withBody(changed(good, text, 0xff)), "protocolViolation"},
      {"bytes left over", withBody(longer), "protocolViolation"},
      {"out of memory", Script().then(Op::exit, Protocol::resourceExitStatus),
       "resourcesExhausted"},
      {"leaves", Script().then(Op::exit, 0), "crashed"},
      {"SIGSYS after half an answer",
       Script().write(Bytes(twice).first(30)).then(Op::raise, SIGSYS), "crashed"},
  };
}

TEST(C8, EachAttackHasItsOutcomeAndTheNextMessageIsServed) {
  Client client(fakeOptions());
  for (const Attack& attack : attacks()) {
    EXPECT_EQ(outcomeOf(client, attack.script), attack.outcome) << attack.name;
    EXPECT_EQ(outcomeOf(client, Script().answer(recordNumbered(1))), "record 1") << attack.name;
  }
}

TEST(C5, OneThatKeepsTheClientWaitingIsGivenUp) {
  Client::Options options = fakeOptions();
  options.timeLimit = milliseconds(300);
  Client client(options);
  const Data good = recordNumbered(7);
  Script dribble;
  for (int i = 0; i < 3; ++i) dribble.write(Bytes(good).first(1)).then(Op::pause, 200);
  const Script waits[] = {
      Script().then(Op::pause, 60'000), dribble, Script().then(Op::raise, SIGSTOP),
      withHeader([](auto& h) { h.bodyLength = 1u << 20; }).then(Op::pause, 60'000)};
  for (const Script& script : waits) {
    const auto start = Clock::now();
    EXPECT_EQ(outcomeOf(client, script), "timedOut");
    EXPECT_GE(Clock::now() - start, options.timeLimit);
    EXPECT_LT(Clock::now() - start, options.timeLimit + milliseconds(1000));
  }
  // The same when the message does not even fit into the channel.
  const Data large(8u << 20);
  const auto outcome = [&](UInt64 command) {
    return outcomeOf([&] {
      client.unpackClientMessage(large, {.command = command, .service = "s"});
      return 0;
    });
  };
  EXPECT_EQ(outcome(ignoreBody), "timedOut");
  EXPECT_EQ(outcome(answerBeforeBody), "protocolViolation");
}

/// The same through every layer of a real service, whose unpacker obeys the message.
TEST(Hostile, ASealedWorkerHasTheSameOutcomes) {
  Client::Options options = fakeOptions();
  options.servicePath = KEELGATE_OBEDIENT_SERVICE;
  // A worker that is used again has memory for the largest message at any time.
  options.largestMessage = 1u << 20;
  const std::pair<std::string_view, const char*> orders[] = {
      {"fault", "crashed"},
      {"abort", "crashed"},
      {"recurse", "crashed"},
      {"spin", "timedOut"},
      {"drip 5441474b01000200", "timedOut"},
      {"say 00", "protocolViolation"},
#ifndef KEELGATE_UNSEALED
      {"call 39", "crashed"},
      {"eat 1000000000", "resourcesExhausted"},
#endif
  };
  for (const std::size_t reuse : {1u, 100u}) {
    options.messagesPerProcess = reuse;
    options.timeLimit = milliseconds(1500);
    Client hasty(options);
    // Workers have the lowest priority: on a busy machine it takes one of them long to fill its
    // memory.
    options.timeLimit = milliseconds(30'000);
    Client patient(options);
    for (const auto& [order, outcome] : orders) {
      Client& client = std::string_view(outcome) == "resourcesExhausted" ? patient : hasty;
      const auto bytes = [](std::string_view text) {
        return std::as_bytes(std::span(text));
      };
      EXPECT_EQ(outcomeOf(client, bytes(order)), outcome) << order;
      EXPECT_TRUE(outcomeOf(client, bytes("answer")).starts_with("record")) << order;
    }
  }
}

/// Each worker counts the messages that it was given.
TEST(C6, AWorkerSeesOneMessageUnlessMoreAreAllowed) {
  for (const std::size_t allowed : {1u, 3u}) {
    Client::Options options = fakeOptions();
    options.servicePath = KEELGATE_OBEDIENT_SERVICE;
    // Far more than any worker can be forked for.
    options.largestMessage = std::numeric_limits<std::size_t>::max();
    options.processes = 1;
    options.messagesPerProcess = allowed;
    Client client(options);
    constexpr std::string_view order = "count";
    for (Int64 i = 0; i < 9; ++i) {
      EXPECT_EQ(client.unpack<VespCommandResponse>(std::as_bytes(std::span(order))).messageId,
                1 + i % static_cast<Int64>(allowed));
    }
  }
}

TEST(C8, WorkersThatSpeakBeforeTheyAreAskedAreNotBelieved) {
  Client client(fakeOptions("early"));
  String outcome;
  // What comes after the message can't be told from its answer: a worker must be early.
  for (int i = 0; i < 20 && outcome != "protocolViolation"; ++i) {
    usleep(100'000);
    outcome = outcomeOf(client, Script().answer(recordNumbered(7)));
  }
  EXPECT_EQ(outcome, "protocolViolation");
}

template <class R>
Data recordAgain(Bytes body) {
  return Transport::encodeRecord(Transport::decodeRecord<R>(body));
}

using Unpacking = VespKeelgateService::VespClientMessageUnpackingError;

Data errorAgain(Bytes body) {
  try {
    Transport::throwError(body);
  } catch (const DecodingError& error) {
    return Transport::encodeError(error);
  } catch (const Breach& error) {
    return Transport::encodeError(error);
  } catch (const Unpacking& error) {
    return Transport::encodeError(error);
  }
}

/// What the real service answers to a message of the examples.
template <class R>
Data replyTo(Client& service, const char* file, const VespClientMessageContext& context = {}) {
  std::ifstream in(String(KEELGATE_EXAMPLES "/") + file, std::ios::binary);
  const std::vector<char> message{std::istreambuf_iterator<char>(in), {}};
  const Bytes bytes = std::as_bytes(std::span(message));
  if constexpr (std::same_as<R, VespClientMessageResult>) {
    return Transport::encodeRecord(service.unpackClientMessage(bytes, context));
  } else {
    return Transport::encodeRecord(service.unpack<R>(bytes));
  }
}

/// Every reply with any one byte changed is known to be a lie, or is the one spelling of another
/// record or error.
TEST(C8, NoChangedByteOfAReplyDoesMore) {
  Client::Options options = fakeOptions();
  options.servicePath = KEELGATE_SERVICE;
  Client service(options);
  const std::pair<Data (*)(Bytes), Data> replies[] = {
      {recordAgain<VespCommandResponse>,
       replyTo<VespCommandResponse>(service, "command-response.xml")},
      {recordAgain<VespInvitation>, replyTo<VespInvitation>(service, "invitation-home.xml")},
      {recordAgain<VespCommandWebTunnelResponse>,
       replyTo<VespCommandWebTunnelResponse>(service, "web-tunnel-response.xml")},
      {recordAgain<PulseUserPayload>, replyTo<PulseUserPayload>(service, "push-payload.xml")},
      {recordAgain<VespClientMessageResult>,
       replyTo<VespClientMessageResult>(
           service, "session-accept.xml",
           {.command = 233, .service = "com.tessen.private.braid.viso.audio"})},
      {errorAgain, Transport::encodeError(DecodingError(DecodingError::Kind::keyNotFound, "k",
                                                        {String("a"), std::size_t{1}}, "missing"))},
      {errorAgain, Transport::encodeError(Breach("domain", "type", "path"))},
      {errorAgain,
       Transport::encodeError(Unpacking::unimplementedCommand(*CommandType::fromRawValue(232)))},
      {errorAgain, Transport::encodeError(Unpacking::noUnpackerForService("s"))}};
#ifdef NDEBUG
  constexpr bool fast = true;
#else
  constexpr bool fast = false;
#endif
  for (const auto& [read, reply] : replies) {
    ASSERT_FALSE(reply.empty());
    Data other = reply;
    for (std::size_t i = 0; i < reply.size(); ++i) {
      // All that a byte can be; of a long reply in a slow build, what flips one bit.
      for (int change = 1; change < 256; change += fast || reply.size() < 500 ? 1 : change) {
        other[i] = reply[i] ^ static_cast<std::byte>(change);
        try {
          EXPECT_EQ(read(other), other) << i << ": " << change;
        } catch (const MalformedReply&) {
        }
      }
      other[i] = reply[i];
    }
  }
}

TEST(C8, NoChangedByteOfAFrameDoesMore) {
  Client client(fakeOptions());
  const Data body = recordNumbered(7);
  const ReplyHeader header = headerFor(body);
  const Bytes head = std::as_bytes(std::span(&header, 1));
  Data frame(head.begin(), head.end());
  frame.insert(frame.end(), body.begin(), body.end());
  for (std::size_t i = 0; i < frame.size(); ++i) {
    // Every bit, and less of the body, which has been through that by itself.
    for (int change = 1; change < 256; change += i < head.size() ? change : 100) {
      Data other = frame;
      other[i] ^= static_cast<std::byte>(change);
      const String outcome = outcomeOf(client, Script().write(other));
      EXPECT_TRUE(outcome == "crashed" || outcome == "protocolViolation" ||
                  // One byte may also say that the worker ends.
                  ((i >= head.size() || (i == offsetof(ReplyHeader, last) && change == 1)) &&
                   outcome.starts_with("record")))
          << i << ": " << outcome;
    }
  }
}

TEST(C8, LogLinesCannotSteerATerminal) {
  String seen;
  Client::Options options = fakeOptions();
  options.log = [&](std::string_view line) {
    seen += String(line) + '|';
  };
  Client client(options);
  const Data good = recordNumbered(7);
  outcomeOf(client, Script()
                        .log("plain, Zürich €")
                        .log("\x1b[2J\r\n\t\x7f")
                        .log("\xc2\x9b"
                             "1A \xff\xc0\x80 \xed\xa0\x80")
                        .answer(good));
  EXPECT_EQ(seen,
            "plain, Zürich €|\\x1b[2J\\x0d\\x0a\\x09\\x7f|"
            "\\xc2\\x9b1A \\xff\\xc0\\x80 \\xed\\xa0\\x80|");
}

/// Standard error may be a pipe whose reader has gone.
TEST(C8, LogLinesCannotEndTheApplication) {
  Client::Options options = fakeOptions();
  options.log = nullptr;
  const pid_t child = fork();
  if (child == 0) {
    int ends[2];
    if (pipe(ends) != 0 || dup2(ends[1], STDERR_FILENO) < 0) _exit(2);
    close(ends[0]);
    signal(SIGPIPE, SIG_DFL);
    Client client(options);
    const Script logs = Script().log("a line").answer(recordNumbered(7));
    _exit(outcomeOf(client, logs) == "record 7" ? 0 : 1);
  }
  int status = -1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
}

}  // namespace
}  // namespace Keelgate::Host
