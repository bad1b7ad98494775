// SPDX-License-Identifier: Apache-2.0
// The life of a client: starting, sharing, retrying, forking, ending.
#include "framework/client/launch.h"
#include "tests/host/host_testing.h"

#include <gtest/gtest.h>

#include <sched.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <ctime>
#include <deque>
#include <future>
#include <limits>

namespace Keelgate::Host {
namespace {

const Script good = Script().answer(7);
const Script fault = Script().then(Op::raise, SIGSEGV);

String startOf(const Client::Options& options) {
  try {
    const Client client(options);
    return "started";
  } catch (const HostError& error) {
    return String(nameOf(error.reason)) + ": " + error.description;
  }
}

TEST(Start, AFailureSaysWhatIsWrong) {
  const auto with = [](String Client::Options::*member, const String& path) {
    Client::Options options = fakeOptions("honest", milliseconds(5000));
    options.*member = path;
    return options;
  };
  constexpr auto program = &Client::Options::servicePath;
  constexpr auto socket = &Client::Options::socket;
  const String longPath(sizeof sockaddr_un::sun_path, 's');
  DescriptorRegistry registry(8);
  const String deaf = temporaryPath("deaf");
  const int listener = boundTo(deaf);
  const String full = temporaryPath("full");
  const int queue = boundTo(full);
  listen(queue, 0);
  const auto first = connectService(full, {}, registry);
  Client::Options layers = fakeOptions("bare");
  layers.requireLayers = true;
  const std::pair<Client::Options, const char*> rows[] = {
      {with(program, "/nowhere/service"), "/nowhere/service could not be started: No such file"},
      {with(program, "/etc/passwd"), "/etc/passwd could not be started: Permission denied"},
      {with(socket, "/nowhere/socket"),
       "No service answers on the socket /nowhere/socket: No such file"},
      {with(socket, deaf), "refused; start the unit that listens there; it is not tried again for"},
      {with(socket, full),
       "unavailable; start the unit that listens there; it is not tried again for"},
      {with(socket, longPath), "The socket's path is longer than the system allows: sss"},
      {layers, "Running without: user namespace, mount namespace"},
#ifndef KEELGATE_UNSEALED
      {fakeOptions("unsealed"), "built without its seal"},
#endif
      {fakeOptions("refuses"), "that the service is started under (Operation not permitted)"},
      {fakeOptions("newer"), "and its client of"},
      {fakeOptions("dies"),
       "The service ended, or said something unknown, while it was starting: check that it is a "
       "VespKeelgateService of this build; it is not tried again for"},
      {fakeOptions("babbles"), "of this build; it is not tried again for"}};
  const std::clock_t before = std::clock();
  // At once: some are tried again for a second, during which nobody is busy.
  std::deque<std::future<String>> outcomes;
  for (const auto& row : rows) {
    outcomes.push_back(std::async(std::launch::async, startOf, row.first));
  }
  for (const auto& [options, sentence] : rows) {
    const String outcome = outcomes.front().get();
    outcomes.pop_front();
    EXPECT_TRUE(outcome.starts_with("startFailed")) << outcome;
    EXPECT_NE(outcome.find(sentence), String::npos) << outcome;
    // Of what does not pass it is not said: nobody has tried twice.
    const bool passes = outcome.find("it is not tried again for") != String::npos;
    EXPECT_EQ(passes, String(sentence).ends_with("it is not tried again for")) << outcome;
  }
  EXPECT_LT(std::clock() - before, CLOCKS_PER_SEC / 2);
  EXPECT_TRUE(children().empty());
  for (const int end : {listener, queue}) close(end);
  for (const String& path : {deaf, full}) std::filesystem::remove(path);
}

TEST(Start, ThereMayBeTooFewDescriptors) {
  // The kernel counts up to the limit, whatever gaps there are in what this process inherited.
  const int firstFree = dup(STDERR_FILENO);
  close(firstFree);
  rlimit before{};
  getrlimit(RLIMIT_NOFILE, &before);
  const auto withSpare = [&](int spare, auto call) {
    const rlimit few{.rlim_cur = static_cast<rlim_t>(firstFree + spare),
                     .rlim_max = before.rlim_max};
    setrlimit(RLIMIT_NOFILE, &few);
    String outcome = call();
    setrlimit(RLIMIT_NOFILE, &before);
    return outcome;
  };
  for (int spare = 0; spare < 8; ++spare) {
    const String outcome = withSpare(spare, [] { return startOf(fakeOptions()); });
    EXPECT_TRUE(outcome == "started" ||
                outcome.find("(ulimit -n); it is not tried again") != String::npos)
        << outcome;
    EXPECT_TRUE(children().empty()) << spare;
  }
  // An event loop takes three more than a client that is there has.
  const auto had = openDescriptors();
  Client client(fakeOptions());
  const auto wait = [&] {
    return outcomeOf([&] { return client.descriptor() > 0; });
  };
  int spare = static_cast<int>(openDescriptors() - had);
  const int least = spare + 3;
  while (withSpare(spare, wait) == "startFailed") ++spare;
  EXPECT_GE(spare, least);
  EXPECT_EQ(wait(), "record 1");
}

TEST(Pool, AMachineWithoutProcessesIsNotTheMessagesFault) {
  Client client(fakeOptions("barren"));
  EXPECT_EQ(outcomeOf(client, good), "startFailed");
  EXPECT_EQ(client.statistics().messages, 1u);
}

TEST(Pool, OnlyAMessageThatFollowedOthersIsTriedAgain) {
  std::size_t tries = 0;
  String told;
  Client::Options options = fakeOptions("bare", milliseconds(20'000), 1);
  options.messagesPerProcess = 3;
  options.log = [&](std::string_view line) {
    ++tries;
    told += line;
  };
  const Script dies = Script().log("try").then(Op::raise, SIGSEGV);
  Client client(options);
  // Once, whatever services follow.
  EXPECT_TRUE(told.starts_with("keelgate: Running without: user namespace")) << told;
  const auto triesOf = [&](const Script& script, const char* outcome) {
    tries = 0;
    EXPECT_EQ(outcomeOf(client, script), outcome);
    return tries;
  };
  EXPECT_EQ(triesOf(dies, "crashed"), 1u);
  EXPECT_EQ(triesOf(good, "record 7"), 0u);
  EXPECT_EQ(triesOf(dies, "crashed"), 2u);
  EXPECT_EQ(triesOf(good, "record 7"), 0u);
  // Whoever has used up the processor's time is late.
  EXPECT_EQ(triesOf(Script().log("try").then(Op::raise, SIGXCPU), "timedOut"), 1u);
  EXPECT_EQ(triesOf(good, "record 7"), 0u);
  EXPECT_EQ(triesOf(Script().log("try").then(Op::raiseIfUsed, SIGSEGV).answer(5), "record 5"), 2u);
}

TEST(Pool, WhatCannotBeAnsweredIsNotSent) {
  Client::Options options = fakeOptions();
  options.largestMessage = 1000;
  Client client(options);
  EXPECT_EQ(outcomeOf(client, Data(1001)), "messageTooLarge");
  EXPECT_EQ(outcomeOf(client, Data(1000)), "crashed");
  options.largestMessage = std::numeric_limits<std::size_t>::max();
  // Its length alone is looked at.
  Client unlimited(options);
  EXPECT_EQ(outcomeOf(unlimited, Bytes(good.data(), std::size_t{1} << 32)), "messageTooLarge");
  const auto naming = [&](std::size_t length) {
    return outcomeOf([&] {
      client.unpackClientMessage({}, {.command = 1, .service = String(length, 's')});
      return 0;
    });
  };
  EXPECT_EQ(naming(65'536), "crashed");
  EXPECT_EQ(naming(65'537), "messageTooLarge");
  using VespKeelgateService::VespClientMessageUnpackingError;
  EXPECT_THROW(client.unpackClientMessage({}, {.command = 1, .service = "\xff"}),
               VespClientMessageUnpackingError);
}

TEST(Application, MayIgnoreOrReapChildren) {
  for (const bool ignores : {true, false}) {
    if (ignores) signal(SIGCHLD, SIG_IGN);
    {
      Client client(fakeOptions());
      EXPECT_EQ(outcomeOf(client, fault), "crashed");
      EXPECT_EQ(outcomeOf(client, good), "record 7");
      kill(*children().begin(), SIGKILL);
      if (!ignores) waitpid(-1, nullptr, 0);
      // The workers follow their zygote, perhaps not before one has been given this message.
      const String outcome = outcomeOf(client, good);
      EXPECT_TRUE(outcome == "record 7" || outcome == "crashed") << outcome;
      EXPECT_EQ(outcomeOf(client, good), "record 7");
    }
    signal(SIGCHLD, SIG_DFL);
    EXPECT_TRUE(children().empty());
  }
}

TEST(Application, ItsForkHasAServiceAndCallsOfItsOwn) {
  Client client(fakeOptions());
  EXPECT_EQ(outcomeOf(client, good), "record 7");
  const std::set<pid_t> before = children();
  int told = 0;
  const auto note = [&](const Outcome<VespCommandResponse>&) {
    ++told;
  };
  client.start<VespCommandResponse>({.message = good}, note);
  EXPECT_EQ(inFork([&] {
              const auto inherited = openDescriptors();
              client.start<VespCommandResponse>({.message = good}, note);
              const bool answered = comesTrue([&] { return client.dispatch(), told > 0; });
              const bool right = outcomeOf(client, Script().answer(2)) == "record 2" &&
                                 children().size() == 1 && openDescriptors() == inherited;
              return answered && told == 1 && right ? 0 : 1;
            }),
            0);
  EXPECT_TRUE(comesTrue([&] { return client.dispatch(), told == 1; }));
  const std::set<pid_t> after = children();
  EXPECT_TRUE(std::includes(after.begin(), after.end(), before.begin(), before.end()));
}

/// What it writes there is not to reach a channel.
TEST(Application, MayHaveNoStandardDescriptors) {
  for (const int first : {0, 2}) {
    const auto trial = [first] {
      closefrom(first);
      DescriptorRegistry registry(1);
      if (Descriptor(registry, open("/", O_PATH)).get() <= 2) return 4;
      Client client(fakeOptions());
      if (client.descriptor() <= 2) return 1;
      for (const auto& [script, outcome] :
           {std::pair(good, "record 7"), {fault, "crashed"}, {good, "record 7"}}) {
        if (outcomeOf(client, script) != outcome) return 2;
      }
      for (int standard = first; standard <= 2; ++standard) {
        if (fcntl(standard, F_GETFD) >= 0) return 3;
      }
      return 0;
    };
    EXPECT_EQ(inFork(trial), 0) << first;
  }
}

TEST(Application, IsToldHowAWorkerEnded) {
  Client client(fakeOptions());
  const std::pair<Script, const char*> rows[] = {
      {Script().then(Op::exit, 3), "it ended with status 3 and no answer"},
      {Script().then(Op::exit, Protocol::refusedExitStatus), "the machine has no memory for it"},
      {Script().then(Op::raise, SIGXCPU), "it used up its processor time"},
      {fault, "signal 11 (Segmentation fault)"}};
  for (const auto& [script, sentence] : rows) {
    try {
      client.unpack<VespCommandResponse>(script);
    } catch (const HostError& error) {
      EXPECT_TRUE(error.description.starts_with(sentence)) << error.description;
    }
  }
}

TEST(Application, KeepsANumberThatAChannelHadBefore) {
  DescriptorRegistry registry(1);
  Descriptor channel(registry, dup(STDERR_FILENO));
  const int number = channel.get();
  channel = Descriptor();
  EXPECT_EQ(dup(STDERR_FILENO), number);
  registry.closeAll();
  EXPECT_EQ(close(number), 0);
  for (int i = 0; i < 3; ++i) channel = Descriptor(registry, dup(STDERR_FILENO));
  channel = Descriptor();
  channel = Descriptor(registry, dup(STDERR_FILENO));
  registry.closeAll();
  EXPECT_LT(fcntl(channel.get(), F_GETFD), 0) << "one that is in use";
}

/// A process number may be the same in another namespace.
TEST(Application, IsToldFromItsForkWhateverTheirNumbers) {
  const int result = inFork([] {
    if (unshare(CLONE_NEWUSER | CLONE_NEWPID) != 0) return 77;
    return inFork([] {
      const ForkMark mark;
      const pid_t number = getpid();
      if (!mark.isOurs() || unshare(CLONE_NEWPID) != 0) return 1;
      const int told = inFork([&] { return getpid() == number && !mark.isOurs() ? 0 : 2; });
      return mark.isOurs() ? told : 3;
    });
  });
  if (result == 77) GTEST_SKIP() << "no namespaces here";
  EXPECT_EQ(result, 0);
}

TEST(Application, GetsBackWhatItHadWhenTheClientEnds) {
  const auto descriptors = openDescriptors();
  const Script stays = Script().then(Op::pause, 60'000);
  for (const char* manner : {"honest", "stuck"}) {
    {
      Client client(fakeOptions(manner));
      // What is under way then is never told, and nobody waits for it.
      const auto start = steady_clock::now();
      client.start<VespCommandResponse>({.message = stays},
                                        [](const auto&) { ADD_FAILURE() << "told"; });
      for (int i = 0; i < 5; ++i) client.dispatch(), usleep(20'000);
      EXPECT_LT(steady_clock::now() - start, milliseconds(1000));
    }
    EXPECT_TRUE(children().empty());
    EXPECT_EQ(openDescriptors(), descriptors);
  }
}

/// Whoever gets the messages of a client must not be just anybody.
TEST(Application, TrustsTheListenersThatItNames) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can listen as somebody else";
  // Everybody trusts root and himself. Whoever is connected is hung up on.
  const std::tuple<uid_t, uid_t, Optional<unsigned>, bool> rows[] = {{65'534, 0, {}, false},
                                                                     {65'534, 0, 65'533, false},
                                                                     {65'534, 0, 65'534, true},
                                                                     {0, 65'533, {}, true},
                                                                     {65'533, 65'533, {}, true}};
  for (const auto& [listens, calls, named, trusted] : rows) {
    Client::Options options = fakeOptions();
    options.socket = temporaryPath("socket");
    options.socketUser = named;
    const int listener = boundTo(options.socket);
    chmod(options.socket.c_str(), 0777);
    ASSERT_TRUE(seteuid(listens) == 0 && listen(listener, 8) == 0);
    std::thread hangsUp([listener] {
      for (int end; (end = accept(listener, nullptr, nullptr)) >= 0;) close(end);
    });
    EXPECT_TRUE(seteuid(0) == 0 && seteuid(calls) == 0);
    const String outcome = startOf(options);
    EXPECT_EQ(seteuid(0), 0);
    const char* sentence = trusted ? "'journalctl -u keelgate@*' says why" : "User 65534 listens";
    EXPECT_NE(outcome.find(sentence), String::npos) << outcome;
    shutdown(listener, SHUT_RDWR);
    hangsUp.join();
    close(listener);
    std::filesystem::remove(options.socket);
  }
}

}  // namespace
}  // namespace Keelgate::Host
