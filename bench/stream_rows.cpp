// SPDX-License-Identifier: Apache-2.0
// What a message costs whoever pipes messages through `keelgate stream`: base64 and JSON on the way
// in, JSON on the way out. All of it counts, the service's processes too: each of them is waited
// for by its parent, so that the kernel adds up the processor time of all.
//
// Each row holds its own run against the bare costs just before it (bare_costs.cpp), on the same
// processors.
#include "plist/writer.h"
#include "text/base64.h"

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <sched.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <map>
#include <string>
#include <vector>

namespace {

using PropertyList::Data;
using PropertyList::Dictionary;

/// A push payload of 2,150 bytes.
std::vector<std::byte> payload() {
  Dictionary fields{{"c", 100},
                    {"v", 8},
                    {"i", "42"},
                    {"qI", "queue-1"},
                    {"e", 1795255200},
                    {"tP", "mailto:ada@example.org"},
                    {"sP", "tel:+15550100"},
                    {"E", "pair"},
                    {"U", Data(16, std::byte{7})},
                    {"t", Data(32, std::byte{9})}};
  constexpr std::size_t wanted = 2150;
  const auto size = [&] {
    return PropertyList::writeBinary(fields).size();
  };
  fields.emplace_back("P", Data(1024, std::byte{1}));
  const std::size_t rest = 1024 + wanted - size();
  fields.back().second = Data(rest, std::byte{1});
  return PropertyList::writeBinary(fields);
}

/// A file of so many requests with the payload.
std::string requests(int count) {
  const auto bytes = payload();
  const std::string line = R"({"record": "PulseUserPayload", "message": ")" +
                           Keelgate::Text::encodeBase64(bytes) + "\", \"id\": 1}\n";
  std::string path = "/tmp/keelgate-stream-XXXXXX";
  close(mkstemp(path.data()));
  std::ofstream file(path, std::ios::binary);
  for (int i = 0; i < count; ++i) file << line;
  return path;
}

struct Cost {
  double wall;
  double used;
};

double microseconds(const timeval& time) {
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_usec);
}

/// Runs a program to its end; the cost in microseconds.
Cost run(std::vector<const char*> arguments, const char* input, const char* output) {
  posix_spawn_file_actions_t files;
  posix_spawn_file_actions_init(&files);
  posix_spawn_file_actions_addopen(&files, STDIN_FILENO, input, O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&files, STDOUT_FILENO, output, O_WRONLY | O_TRUNC, 0);
  arguments.push_back(nullptr);
  const auto begin = std::chrono::steady_clock::now();
  pid_t pid = -1;
  rusage used{};
  int status = -1;
  if (posix_spawn(&pid, arguments[0], &files, nullptr, const_cast<char* const*>(arguments.data()),
                  environ) == 0) {
    wait4(pid, &status, 0, &used);
  }
  posix_spawn_file_actions_destroy(&files);
  const std::chrono::duration<double, std::micro> wall = std::chrono::steady_clock::now() - begin;
  if (status != 0) return {-1, -1};
  return {wall.count(), microseconds(used.ru_utime) + microseconds(used.ru_stime)};
}

/// Takes this process and what it starts to so many processors, for its time.
class OnProcessors {
 public:
  explicit OnProcessors(int count) {
    sched_getaffinity(0, sizeof before_, &before_);
    cpu_set_t some;
    CPU_ZERO(&some);
    for (int i = 0, found = 0; i < CPU_SETSIZE && found < count; ++i) {
      if (CPU_ISSET(i, &before_)) CPU_SET(i, &some), ++found;
    }
    sched_setaffinity(0, sizeof some, &some);
  }
  ~OnProcessors() { sched_setaffinity(0, sizeof before_, &before_); }
  OnProcessors(const OnProcessors&) = delete;
  OnProcessors& operator=(const OnProcessors&) = delete;

 private:
  cpu_set_t before_{};
};

double median(std::vector<double> values) {
  std::sort(values.begin(), values.end());
  return values[values.size() / 2];
}

/// How the messages get their processes.
struct Way {
  const char* messagesPerProcess;
  const char* isolation;
};

void stream(benchmark::State& state, Way way, int processors) {
  constexpr int count = 10'000;
  static const std::string input = requests(count);
  // What a run costs that has one message: starting and ending the service.
  static const std::string oneInput = requests(1);
  const std::string figures = oneInput + ".bare";
  std::ofstream(figures).close();
  const OnProcessors pinned(processors);
  const std::string processes = std::to_string(processors);
  const std::vector<const char*> command{KEELGATE_COMMAND,
                                         "stream",
                                         "--processes",
                                         processes.c_str(),
                                         "--messages-per-process",
                                         way.messagesPerProcess,
                                         "--isolation",
                                         way.isolation};
  std::map<std::string, std::vector<double>> columns;
  for ([[maybe_unused]] auto _ : state) {
    run({KEELGATE_BARE_COSTS}, "/dev/null", figures.c_str());
    Cost fork{};
    double trip = 0;
    std::ifstream(figures) >> fork.wall >> fork.used >> trip;
    const Cost start = run(command, oneInput.c_str(), "/dev/null");
    Cost whole = run(command, input.c_str(), "/dev/null");
    if (start.wall < 0 || whole.wall < 0) return state.SkipWithError("stream failed");
    whole = {.wall = (whole.wall - start.wall) / count, .used = (whole.used - start.used) / count};
    state.SetIterationTime(whole.wall / 1e6);
    columns["wall_us"].push_back(whole.wall);
    columns["processor_us"].push_back(whole.used);
    columns["fork_us"].push_back(fork.wall);
    columns["fork_processor_us"].push_back(fork.used);
    columns["pipelined_us"].push_back(trip);
    columns["x_fork"].push_back(whole.wall / fork.wall);
    columns["x_fork_processor"].push_back(whole.used / fork.used);
    columns["x_pipelined"].push_back(whole.wall / trip);
  }
  for (const auto& [name, values] : columns) state.counters[name] = median(values);
  unlink(figures.c_str());
}

constexpr Way forked{"1", "fork"};
constexpr Way rewound{"1", "rewind"};
constexpr Way reused{"1000000000", "fork"};
BENCHMARK_CAPTURE(stream, forkedOnOneProcessor, forked, 1)->UseManualTime()->Iterations(5);
BENCHMARK_CAPTURE(stream, rewoundOnOneProcessor, rewound, 1)->UseManualTime()->Iterations(5);
BENCHMARK_CAPTURE(stream, reusedOnOneProcessor, reused, 1)->UseManualTime()->Iterations(5);
BENCHMARK_CAPTURE(stream, forkedOnTwoProcessors, forked, 2)->UseManualTime()->Iterations(5);
BENCHMARK_CAPTURE(stream, rewoundOnTwoProcessors, rewound, 2)->UseManualTime()->Iterations(5);
BENCHMARK_CAPTURE(stream, reusedOnTwoProcessors, reused, 2)->UseManualTime()->Iterations(5);

}  // namespace
