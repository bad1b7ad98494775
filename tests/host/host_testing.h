// SPDX-License-Identifier: Apache-2.0
/// What the tests of the host share: clients of the fake service, and outcomes as short texts.
#pragma once

#include "tests/host/script.h"

#include <keelgate/client.h>

#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <set>

namespace Keelgate::Host {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

/// A path of this process's own, for what goes when the program ends.
inline String temporaryPath(const String& name) {
  return std::filesystem::temp_directory_path() /
         ("keelgate-" + std::to_string(getpid()) + '-' + name);
}

/// The fake service under a name that tells it how to start.
inline String fakeService(const String& manner = "honest") {
  struct Links : std::set<String> {
    ~Links() {
      std::error_code ignored;
      for (const String& link : *this) std::filesystem::remove(link, ignored);
    }
  };
  static Links links;
  String link = temporaryPath("fake_service." + manner);
  if (links.insert(link).second) {
    std::filesystem::remove(link);
    std::filesystem::create_symlink(KEELGATE_FAKE_SERVICE, link);
  }
  return link;
}

inline Client::Options optionsFor(const String& service, milliseconds limit, unsigned processes) {
  Client::Options options;
  options.processes = processes;
  options.timeLimit = limit;
  options.servicePath = service;
  // Tests make workers fail by the hundred.
  options.abnormalEndsPerSecond = 0;
  options.log = [](std::string_view) {
  };
  return options;
}

inline Client::Options fakeOptions(const String& manner = "honest",
                                   milliseconds limit = milliseconds(20'000),
                                   unsigned processes = 2) {
  return optionsFor(fakeService(manner), limit, processes);
}

/// "record N", "decoding", "breach", or the reason of the host.
template <class Call>
String outcomeOf(Call call) {
  try {
    return "record " + std::to_string(call());
  } catch (const HostError& error) {
    return String(nameOf(error.reason));
  } catch (const DecodingError&) {
    return "decoding";
  } catch (const Breach&) {
    return "breach";
  }
}

inline String outcomeOf(Client& client, Bytes message) {
  return outcomeOf([&] { return client.unpack<VespCommandResponse>(message).command; });
}

/// What the body returns in a fork of this process; -1 when it ends otherwise.
template <class Body>
int inFork(Body body) {
  const pid_t child = fork();
  if (child == 0) _exit(static_cast<int>(body()));
  int status = -1;
  waitpid(child, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

template <class Condition>
bool comesTrue(Condition condition) {
  for (int i = 0; i < 500; ++i) {
    if (condition()) return true;
    usleep(10'000);
  }
  return false;
}

inline std::ptrdiff_t entriesOf(const char* folder) {
  return std::distance(std::filesystem::directory_iterator(folder), {});
}

inline std::ptrdiff_t openDescriptors() {
  return entriesOf("/proc/self/fd");
}

/// Zombies too; none where the process has gone.
inline std::set<pid_t> children(pid_t of = getpid()) {
  std::set<pid_t> all;
  std::error_code gone;
  const auto tasks = "/proc/" + std::to_string(of) + "/task";
  for (const auto& task : std::filesystem::directory_iterator(tasks, gone)) {
    std::ifstream list(task.path() / "children");
    for (pid_t pid; list >> pid;) all.insert(pid);
  }
  return all;
}

}  // namespace Keelgate::Host
