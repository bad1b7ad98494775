// SPDX-License-Identifier: Apache-2.0
// C9: whoever is killed, stopped or faulted, and at whatever step, each message has one outcome, in
// time, and the service goes on.
#include "tests/host/host_testing.h"

#include <gtest/gtest.h>

#include <csignal>

namespace Keelgate::Host {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr milliseconds limit(400);
constexpr int strikes[] = {SIGKILL, SIGSEGV, SIGSTOP};

Client::Options limited() {
  Client::Options options = fakeOptions();
  options.processes = 1;
  options.timeLimit = limit;
  return options;
}

/// Runs the call and holds it to its deadline and a second.
template <class Call>
String inTime(Call call) {
  const auto start = steady_clock::now();
  String outcome = call();
  EXPECT_LE(steady_clock::now() - start, limit + milliseconds(1000)) << outcome;
  return outcome;
}

/// Whether a message is answered again, after few that something which was hit explains.
bool settles(Client& client, Bytes message, const String& record) {
  for (int i = 0; i < 6; ++i) {
    const String outcome = inTime([&] { return outcomeOf(client, message); });
    if (outcome == record) return true;
    EXPECT_TRUE(outcome == "crashed" || outcome == "timedOut") << outcome;
  }
  return false;
}

/// What a worker does until the signal comes; the last has answered.
std::vector<Script> steps() {
  const Data body = recordNumbered(7);
  const Protocol::ReplyHeader header{
      Protocol::magic, Protocol::protocolVersion, Protocol::ReplyKind::record, 0, 0, body.size()};
  const Bytes head = std::as_bytes(std::span(&header, 1));
  return {Script(),
          Script().log("a line"),
          Script().write(head.first(10)),
          Script().write(head),
          Script().write(head).write(Bytes(body).first(20)),
          Script().answer(body)};
}

TEST(C9, AWorkerHitAtAnyStepLosesItsOwnMessageAlone) {
  Client client(limited());
  const auto good = Script().answer(recordNumbered(1));
  for (const int signal : strikes) {
    const char* const lost = signal == SIGSTOP ? "timedOut" : "crashed";
    EXPECT_EQ(inTime([&] {
                return outcomeOf([&] {
                  const UInt64 command = raiseAfterHeader + static_cast<UInt64>(signal);
                  client.unpackClientMessage(good, {.command = command, .service = "s"});
                  return 0;
                });
              }),
              lost);
    const std::vector<Script> all = steps();
    for (std::size_t i = 0; i < all.size(); ++i) {
      Script script = all[i];
      script.then(Op::raise, static_cast<std::uint32_t>(signal));
      EXPECT_EQ(inTime([&] { return outcomeOf(client, script); }),
                i + 1 == all.size() ? "record 7" : lost)
          << signal << " at " << i;
      EXPECT_EQ(inTime([&] { return outcomeOf(client, good); }), "record 1") << signal << i;
    }
  }
}

TEST(C9, AZygoteHitAtAnyStepOfAMessageIsReplaced) {
  const auto good = Script().answer(recordNumbered(1));
  for (const int signal : strikes) {
    for (Script script : steps()) {
      Client client(limited());
      script.then(Op::hitZygote, static_cast<std::uint32_t>(signal)).then(Op::pause, 50);
      const String outcome = inTime([&] { return outcomeOf(client, script); });
      EXPECT_TRUE(outcome == "record 7" || outcome == "crashed") << signal << ": " << outcome;
      EXPECT_TRUE(settles(client, good, "record 1")) << signal;
    }
  }
}

std::vector<pid_t> childrenOf(const std::vector<pid_t>& parents) {
  std::vector<pid_t> all;
  for (const pid_t parent : parents) {
    const auto tasks = std::filesystem::path("/proc") / std::to_string(parent) / "task";
    std::ifstream list(tasks / std::to_string(parent) / "children");
    for (pid_t pid; list >> pid;) all.push_back(pid);
  }
  return all;
}

/// The real service: its launcher, its zygote, its spare workers.
TEST(C9, WhoeverIsHitWhileNothingIsAskedIsReplaced) {
  const std::string_view text = "<plist><dict><key>c</key><integer>1</integer></dict></plist>";
  for (const int signal : strikes) {
    for (const int depth : {0, 1, 2}) {
      // The first process of a namespace takes no such signal from outside.
      if (signal == SIGSEGV && depth == 1) continue;
      Client::Options options = limited();
      options.servicePath = KEELGATE_SERVICE;
      Client client(options);
      ASSERT_TRUE(settles(client, std::as_bytes(std::span(text)), "record 1"));
      std::vector<pid_t> victims = childrenOf({getpid()});
      for (int i = 0; i < depth; ++i) victims = childrenOf(victims);
      ASSERT_FALSE(victims.empty());
      for (const pid_t victim : victims) kill(victim, signal);
      EXPECT_TRUE(settles(client, std::as_bytes(std::span(text)), "record 1"))
          << signal << " at depth " << depth;
    }
  }
}

}  // namespace
}  // namespace Keelgate::Host
