// SPDX-License-Identifier: Apache-2.0
/// What the tests of the host share: clients of the fake service, and outcomes as short texts.
#pragma once

#include "tests/host/script.h"

#include <keelgate/client.h>

#include <filesystem>
#include <fstream>
#include <set>

namespace Keelgate::Host {

/// The fake service under a name that tells it how to start; the names go when the program ends.
inline String fakeService(const String& manner = "honest") {
  struct Links {
    std::set<std::filesystem::path> made;
    std::error_code ignored;
    ~Links() {
      for (const auto& link : made) std::filesystem::remove(link, ignored);
    }
  };
  static Links links;
  const auto link = std::filesystem::temp_directory_path() /
                    ("keelgate-" + std::to_string(getpid()) + "-fake_service." + manner);
  if (links.made.insert(link).second) {
    std::filesystem::remove(link, links.ignored);
    std::filesystem::create_symlink(KEELGATE_FAKE_SERVICE, link);
  }
  return link.string();
}

inline Client::Options fakeOptions(const String& manner = "honest") {
  Client::Options options;
  options.processes = 2;
  options.timeLimit = std::chrono::milliseconds(20'000);
  options.servicePath = fakeService(manner);
  // Tests make workers fail by the hundred.
  options.abnormalEndsPerSecond = 0;
  options.log = [](std::string_view) {
  };
  return options;
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

inline std::size_t openDescriptors() {
  std::size_t n = 0;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
    ++n;
  }
  return n;
}

/// Zombies too.
inline std::set<int> children() {
  std::set<int> all;
  for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
    std::ifstream list(task.path() / "children");
    for (int pid; list >> pid;) all.insert(pid);
  }
  return all;
}

}  // namespace Keelgate::Host
