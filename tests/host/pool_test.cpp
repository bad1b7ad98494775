// SPDX-License-Identifier: Apache-2.0
// The life of a client: starting, sharing, retrying, forking, ending.
#include "framework/client/descriptor.h"
#include "tests/host/host_testing.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <sched.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <csignal>
#include <iterator>
#include <thread>

namespace Keelgate::Host {
namespace {

using std::chrono::milliseconds;

Script good(Int number = 7) {
  return Script().answer(recordNumbered(number));
}

String startOf(const Client::Options& options) {
  try {
    const Client client(options);
    return "started";
  } catch (const HostError& error) {
    return String(nameOf(error.reason)) + ": " + error.description;
  }
}

TEST(Start, AFailureSaysWhatIsWrong) {
  Client::Options missing = fakeOptions();
  missing.servicePath = "/nowhere/service";
  Client::Options noProgram = fakeOptions();
  noProgram.servicePath = "/etc/passwd";
  Client::Options noSocket = fakeOptions();
  noSocket.socket = "/nowhere/socket";
  Client::Options layers = fakeOptions("bare");
  layers.requireLayers = true;
  const std::pair<Client::Options, const char*> rows[] = {
      {missing, "/nowhere/service could not be started: No such file"},
      {noProgram, "/etc/passwd could not be started: Permission denied"},
      {noSocket, "No service answers on the socket /nowhere/socket: No such file"},
      {layers, "Running without: user namespace, mount namespace"},
#ifndef KEELGATE_UNSEALED
      {fakeOptions("unsealed"), "built without its seal"},
#endif
      {fakeOptions("refuses"), "The kernel refused the system call filter: use a kernel with"},
      {fakeOptions("newer"), "and its client of"},
      {fakeOptions("dies"), "of this build; it is not tried again for"},
      {fakeOptions("mute"), "did not get ready in time"},
      {fakeOptions("babbles"), "ended, or said something unknown, while it was starting"}};
  for (const auto& [options, sentence] : rows) {
    const String outcome = startOf(options);
    EXPECT_TRUE(outcome.starts_with("startFailed")) << outcome;
    EXPECT_NE(outcome.find(sentence), String::npos) << outcome;
  }
  EXPECT_TRUE(children().empty());
}

TEST(Start, MissingSecondWallsAreToldOnceAndReported) {
  std::vector<String> lines;
  Client::Options options = fakeOptions("bare");
  options.log = [&](std::string_view line) {
    lines.emplace_back(line);
  };
  Client client(options);
  EXPECT_EQ(outcomeOf(client, Script().then(Op::raise, SIGSEGV)), "crashed");
  EXPECT_EQ(outcomeOf(client, good()), "record 7");
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_TRUE(lines[0].starts_with("keelgate: Running without: user namespace")) << lines[0];
  std::size_t present = 0;
  for (const SandboxLayer& layer : client.report().layers) present += layer.present ? 1 : 0;
  EXPECT_EQ(present, 6u);
}

TEST(Start, ThereMayBeTooFewDescriptors) {
  // The kernel counts up to the limit, whatever gaps there are in what this process inherited.
  const int firstFree = dup(STDERR_FILENO);
  close(firstFree);
  rlimit before{};
  getrlimit(RLIMIT_NOFILE, &before);
  for (rlim_t spare = 0; spare < 8; ++spare) {
    const rlimit few{.rlim_cur = static_cast<rlim_t>(firstFree) + spare,
                     .rlim_max = before.rlim_max};
    setrlimit(RLIMIT_NOFILE, &few);
    const String outcome = startOf(fakeOptions());
    setrlimit(RLIMIT_NOFILE, &before);
    EXPECT_TRUE(outcome == "started" || outcome.find("ulimit -n") != String::npos) << outcome;
    EXPECT_TRUE(children().empty()) << spare;
  }
}

TEST(Pool, AMachineWithoutProcessesIsNotTheMessagesFault) {
  Client client(fakeOptions("barren"));
  EXPECT_EQ(outcomeOf(client, good()), "startFailed");
}

TEST(Pool, AWorkerThatStaysAfterItsAnswerIsKilled) {
  Client client(fakeOptions());
  const auto stays = good().then(Op::pause, 60'000);
  for (int i = 0; i < 10; ++i) {
    EXPECT_EQ(outcomeOf(client, stays), "record 7");
    usleep(20'000);
  }
  const std::string zygote = std::to_string(*children().begin());
  const auto workers = [&] {
    std::ifstream list("/proc/" + zygote + "/task/" + zygote + "/children");
    return std::distance(std::istream_iterator<pid_t>(list), {});
  };
  // Two that are kept ready, one that has just answered, one that is being killed. A busy machine
  // takes its time, but those that are not killed would stay a minute.
  for (int i = 0; i < 100 && workers() > 4; ++i) usleep(50'000);
  EXPECT_LE(workers(), 4);
}

TEST(Pool, AZygoteThatDoesNotServeIsReplacedInTime) {
  Client::Options options = fakeOptions("stuck");
  options.timeLimit = milliseconds(100);
  Client client(options);
  const std::set<int> before = children();
  EXPECT_EQ(outcomeOf(client, good()), "timedOut");
  EXPECT_EQ(outcomeOf(client, good()), "timedOut");
  EXPECT_NE(children(), before);
}

TEST(Pool, OnlyAMessageThatFollowedOthersIsTriedAgain) {
  std::size_t tries = 0;
  Client::Options options = fakeOptions();
  options.processes = 1;
  options.messagesPerProcess = 3;
  options.log = [&](std::string_view) {
    ++tries;
  };
  Client client(options);
  const auto triesOf = [&](const Script& script, const char* outcome) {
    tries = 0;
    EXPECT_EQ(outcomeOf(client, script), outcome);
    return tries;
  };
  const Script dies = Script().log("try").then(Op::raise, SIGSEGV);
  EXPECT_EQ(triesOf(dies, "crashed"), 1u);
  EXPECT_EQ(triesOf(good(), "record 7"), 0u);
  EXPECT_EQ(triesOf(dies, "crashed"), 2u);
  EXPECT_EQ(triesOf(good(), "record 7"), 0u);
  EXPECT_EQ(triesOf(Script().log("try").then(Op::raiseIfUsed, SIGSEGV).answer(recordNumbered(5)),
                    "record 5"),
            2u);
}

TEST(Pool, ManyThreadsShareFewProcesses) {
  Client client(fakeOptions());
  std::atomic<int> right = 0;
  std::vector<std::thread> threads;
  for (Int t = 0; t < 6; ++t) {
    threads.emplace_back([&, t] {
      for (Int i = 0; i < 40; ++i) {
        const Int number = t * 1000 + i;
        if (outcomeOf(client, good(number)) == "record " + std::to_string(number)) ++right;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(right, 240);
}

TEST(Pool, WhatCannotBeAnsweredIsNotSent) {
  Client::Options options = fakeOptions();
  options.largestMessage = 1000;
  Client client(options);
  EXPECT_EQ(outcomeOf(client, Data(1001)), "messageTooLarge");
  EXPECT_EQ(outcomeOf(client, Data(1000)), "crashed");
  EXPECT_EQ(outcomeOf([&] {
              client.unpackClientMessage({}, {.command = 1, .service = String(65'537, 's')});
              return 0;
            }),
            "messageTooLarge");
  using VespKeelgateService::VespClientMessageUnpackingError;
  EXPECT_THROW(client.unpackClientMessage({}, {.command = 1, .service = "\xff"}),
               VespClientMessageUnpackingError);
}

TEST(Application, MayIgnoreOrReapChildren) {
  for (const bool ignores : {true, false}) {
    if (ignores) signal(SIGCHLD, SIG_IGN);
    {
      Client client(fakeOptions());
      EXPECT_EQ(outcomeOf(client, Script().then(Op::raise, SIGSEGV)), "crashed");
      EXPECT_EQ(outcomeOf(client, good()), "record 7");
      kill(*children().begin(), SIGKILL);
      if (!ignores) waitpid(-1, nullptr, 0);
      // The workers follow their zygote, perhaps not before one has been given this message.
      if (const String outcome = outcomeOf(client, good()); outcome != "record 7") {
        EXPECT_EQ(outcome, "crashed");
        EXPECT_EQ(outcomeOf(client, good()), "record 7");
      }
    }
    signal(SIGCHLD, SIG_DFL);
    EXPECT_TRUE(children().empty());
  }
}

TEST(Application, ItsForkHasAServiceOfItsOwn) {
  Client client(fakeOptions());
  EXPECT_EQ(outcomeOf(client, good(1)), "record 1");
  const std::set<int> before = children();
  const pid_t child = fork();
  if (child == 0) {
    const std::size_t inherited = openDescriptors();
    const bool right = outcomeOf(client, good(2)) == "record 2" && children().size() == 1 &&
                       openDescriptors() == inherited;
    _exit(right ? 0 : 1);
  }
  EXPECT_EQ(outcomeOf(client, good(3)), "record 3");
  int status = -1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(outcomeOf(client, good(4)), "record 4");
  const std::set<int> after = children();
  EXPECT_TRUE(std::includes(after.begin(), after.end(), before.begin(), before.end()));
}

/// What it writes there is not to reach a channel.
TEST(Application, MayHaveNoStandardDescriptors) {
  const pid_t child = fork();
  if (child == 0) {
    closefrom(0);
    Client client(fakeOptions());
    const bool right = outcomeOf(client, good()) == "record 7" &&
                       outcomeOf(client, Script().then(Op::raise, SIGSEGV)) == "crashed" &&
                       outcomeOf(client, good()) == "record 7" && client.descriptor() > 2;
    for (const int standard : {0, 1, 2}) {
      if (fcntl(standard, F_GETFD) >= 0) _exit(2);
    }
    _exit(right ? 0 : 1);
  }
  int status = -1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
}

/// A process number may be the same in another namespace.
TEST(Application, IsToldFromItsForkWhateverTheirNumbers) {
  const pid_t child = fork();
  if (child == 0) {
    if (unshare(CLONE_NEWUSER | CLONE_NEWPID) != 0) _exit(77);
    const pid_t first = fork();
    if (first == 0) {
      const ForkMark mark;
      const pid_t number = getpid();
      if (!mark.isOurs() || unshare(CLONE_NEWPID) != 0) _exit(1);
      const pid_t second = fork();
      if (second == 0) _exit(getpid() == number && !mark.isOurs() ? 0 : 1);
      int status = -1;
      waitpid(second, &status, 0);
      _exit(status == 0 && mark.isOurs() ? 0 : 1);
    }
    int status = -1;
    waitpid(first, &status, 0);
    _exit(status == 0 ? 0 : 1);
  }
  int status = -1;
  waitpid(child, &status, 0);
  if (WEXITSTATUS(status) == 77) GTEST_SKIP() << "no namespaces here";
  EXPECT_EQ(status, 0);
}

TEST(Application, GetsBackWhatItHadWhenTheClientEnds) {
  const std::size_t descriptors = openDescriptors();
  for (const char* manner : {"honest", "stuck"}) {
    { const Client client(fakeOptions(manner)); }
    EXPECT_TRUE(children().empty());
    EXPECT_EQ(openDescriptors(), descriptors);
  }
}

/// Serves connections of a socket as a service manager does: each gets a service on descriptor 3.
class Activator {
 public:
  /// `user` listens; the service is started under the name `manner`.
  explicit Activator(const String& path, uid_t user = geteuid(),
                     const char* manner = "fake_service")
      : path_(path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    listener_ = socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
    if (bind(listener_, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) abort();
    if (seteuid(user) != 0 || listen(listener_, 8) != 0 || seteuid(getuid()) != 0) abort();
    pid_ = fork();
    while (pid_ == 0) {
      const int connection = accept(listener_, nullptr, nullptr);
      signal(SIGCHLD, SIG_IGN);
      if (fork() == 0) {
        signal(SIGCHLD, SIG_DFL);
        dup2(connection, 3);
        for (const int standard : {0, 1, 2}) close(standard);
        closefrom(4);
        execle(KEELGATE_FAKE_SERVICE, manner, nullptr, std::array<char*, 1>().data());
        _exit(1);
      }
      close(connection);
    }
  }
  ~Activator() {
    kill(pid_, SIGKILL);
    waitpid(pid_, nullptr, 0);
    close(listener_);
    std::filesystem::remove(path_);
  }

 private:
  String path_;
  int listener_;
  pid_t pid_;
};

Client::Options activated() {
  Client::Options options = fakeOptions();
  options.socket =
      std::filesystem::temp_directory_path() / ("keelgate-" + std::to_string(getpid()) + "-socket");
  return options;
}

/// Whoever gets the messages of a client must not be just anybody.
TEST(Application, TrustsTheListenersThatItNames) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can listen as somebody else";
  Client::Options options = activated();
  const Activator activator(options.socket, 65'534);
  EXPECT_NE(startOf(options).find("User 65534 listens"), String::npos);
  options.socketUser = 65'533;
  EXPECT_NE(startOf(options).find("User 65534 listens"), String::npos);
  options.socketUser = 65'534;
  EXPECT_EQ(startOf(options), "started");
}

TEST(Application, IsToldWhereTheServiceManagerSaysWhy) {
  const Client::Options options = activated();
  const Activator activator(options.socket, geteuid(), "fake_service.dies");
  const String outcome = startOf(options);
  EXPECT_NE(outcome.find("journalctl -u"), String::npos) << outcome;
  EXPECT_NE(outcome.find("MaxConnections"), String::npos) << outcome;
}

TEST(Application, MayUseAnActivatedService) {
  const Client::Options options = activated();
  const Activator activator(options.socket);
  Client client(options);
  for (const Int number : {1, 2}) {
    EXPECT_EQ(outcomeOf(client, Script().then(Op::raise, SIGSEGV)), "crashed");
    EXPECT_EQ(outcomeOf(client, good(number)), "record " + std::to_string(number));
  }
}

}  // namespace
}  // namespace Keelgate::Host
