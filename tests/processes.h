// SPDX-License-Identifier: Apache-2.0
/// Processes, as tests make them and look at them.
#pragma once

#include <keelgate/values.h>

#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <set>
#include <string>
#include <string_view>

namespace Keelgate::Testing {

/// Tests run once with workers that are rewound and once, by this, with forks alone.
inline bool forksAlone() {
  return std::getenv("KEELGATE_TEST_FORKS") != nullptr;
}

inline Bytes bytesOf(std::string_view text) {
  return std::as_bytes(std::span(text));
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

}  // namespace Keelgate::Testing
