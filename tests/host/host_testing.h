// SPDX-License-Identifier: Apache-2.0
/// What the tests of the host share: clients of the fake service, and outcomes as short texts.
#pragma once

#include "tests/host/script.h"
#include "tests/processes.h"

#include <keelgate/client.h>

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <thread>

namespace Keelgate::Host {

using namespace Testing;

using std::chrono::milliseconds;
using std::chrono::steady_clock;

/// A path of this process's own, for what goes when the program ends.
inline String temporaryPath(const String& name) {
  return std::filesystem::temp_directory_path() /
         ("keelgate-" + std::to_string(getpid()) + '-' + name);
}

/// A socket that has the path, for which nobody listens yet.
inline int boundTo(const String& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  const int listener = socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
  if (bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) abort();
  return listener;
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
  if (Testing::forksAlone()) options.isolation = Client::Isolation::fork;
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

/// The process that the workers of a client are forked from just now.
inline pid_t zygoteOf(Client& client) {
  const Script script = Script().then(Op::answerZygote);
  return static_cast<pid_t>(client.unpack<VespCommandResponse>(script).command);
}

inline std::ptrdiff_t entriesOf(const char* folder) {
  return std::distance(std::filesystem::directory_iterator(folder), {});
}

inline std::ptrdiff_t openDescriptors() {
  return entriesOf("/proc/self/fd");
}

}  // namespace Keelgate::Host
