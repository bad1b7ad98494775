// SPDX-License-Identifier: Apache-2.0
/// What a message costs in processor time, of the client and of all that it has started: by fork,
/// as the service does it, by setting back, and in a worker that is used again, which is the floor.
///
/// Two uses: calls of the library, one after the other, and lines for `keelgate stream`.
///
/// Rounds of the three take turns, and each figure is the median of its rounds. To be run on one
/// processor (taskset -c 1), or the time includes what two of them do to each other's caches.
#include "text/base64.h"

#include <keelgate/client.h>

#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <span>
#include <string>
#include <vector>

namespace Keelgate {
namespace {

struct Cost {
  double processor;
  double elapsed;
};

std::vector<char> readMessage(const char* path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

double microseconds(const timeval& time) {
  return 1e6 * static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec);
}

double usedBy(int who) {
  rusage used{};
  getrusage(who, &used);
  return microseconds(used.ru_utime) + microseconds(used.ru_stime);
}

/// All processes of a client have been waited for when it is gone, and are counted by then.
Cost unpack(const Client::Options& options, const std::vector<char>& message, int count) {
  const auto start = std::chrono::steady_clock::now();
  const double before = usedBy(RUSAGE_SELF) + usedBy(RUSAGE_CHILDREN);
  {
    Client client(options);
    for (int i = 0; i < count; ++i) {
      client.unpack<VespCommandResponse>(std::as_bytes(std::span(message)));
    }
  }
  const std::chrono::duration<double, std::micro> elapsed =
      std::chrono::steady_clock::now() - start;
  return {usedBy(RUSAGE_SELF) + usedBy(RUSAGE_CHILDREN) - before, elapsed.count()};
}

/// The same by the command, with a line for each message.
Cost stream(const Client::Options& options, const std::vector<char>& message, int count) {
  const std::string line = R"({"record": "VespCommandResponse", "message": ")" +
                           Text::encodeBase64(std::as_bytes(std::span(message))) + "\"}\n";
  const std::string limit = std::to_string(options.messagesPerProcess);
  std::string path = "/tmp/keelgate-rewind-XXXXXX";
  close(mkstemp(path.data()));
  {
    std::ofstream lines(path);
    for (int i = 0; i < count; ++i) lines << line;
  }
  const auto start = std::chrono::steady_clock::now();
  const double before = usedBy(RUSAGE_CHILDREN);
  // Or the child writes it, too.
  std::fflush(stdout);
  const pid_t process = fork();
  if (process == 0) {
    if (std::freopen(path.c_str(), "r", stdin) == nullptr ||
        std::freopen("/dev/null", "w", stdout) == nullptr) {
      _exit(1);
    }
    execl(KEELGATE_COMMAND, "keelgate", "stream", "--processes", "1", "--messages-per-process",
          limit.c_str(), "--service-path", options.servicePath.c_str(), nullptr);
    _exit(1);
  }
  int status = 0;
  if (waitpid(process, &status, 0) != process || status != 0) std::abort();
  unlink(path.c_str());
  const std::chrono::duration<double, std::micro> elapsed =
      std::chrono::steady_clock::now() - start;
  return {usedBy(RUSAGE_CHILDREN) - before, elapsed.count()};
}

using Use = Cost (*)(const Client::Options&, const std::vector<char>&, int);

/// Of one message, without the start of the service and the first workers.
Cost perMessage(Use use, const Client::Options& options, const std::vector<char>& message,
                int count) {
  constexpr int first = 20;
  const Cost start = use(options, message, first);
  const Cost all = use(options, message, first + count);
  return {(all.processor - start.processor) / count, (all.elapsed - start.elapsed) / count};
}

double median(std::vector<double> values) {
  std::sort(values.begin(), values.end());
  return values[values.size() / 2];
}

struct Way {
  const char* name;
  Client::Options options;
  std::vector<double> processor = {};
  std::vector<double> elapsed = {};
};

Client::Options optionsFor(const char* service, std::size_t messages) {
  Client::Options options;
  options.processes = 1;
  options.messagesPerProcess = messages;
  options.servicePath = service;
  return options;
}

void compareWays(const char* name, Use use, int rounds, int count) {
  const std::vector<char> message = readMessage(KEELGATE_EXAMPLES "/command-response.bplist");
  Way ways[]{{.name = "forked", .options = optionsFor(KEELGATE_SERVICE, 1)},
             {.name = "set back", .options = optionsFor(KEELGATE_REWINDING_SERVICE, 1)},
             {.name = "used again", .options = optionsFor(KEELGATE_SERVICE, 1'000'000'000)}};
  std::vector<double> ratios;
  for (int round = 0; round < rounds; ++round) {
    for (Way& way : ways) {
      const Cost cost = perMessage(use, way.options, message, count);
      way.processor.push_back(cost.processor);
      way.elapsed.push_back(cost.elapsed);
    }
    ratios.push_back(ways[1].processor.back() / ways[0].processor.back());
  }
  std::printf("%s: %d rounds of %d messages; microseconds a message\n", name, rounds, count);
  std::puts("            processor  least   most   elapsed");
  for (const Way& way : ways) {
    const auto [least, most] = std::minmax_element(way.processor.begin(), way.processor.end());
    std::printf("%-10s  %9.1f %6.1f %6.1f %9.1f\n", way.name, median(way.processor), *least, *most,
                median(way.elapsed));
  }
  const auto [least, most] = std::minmax_element(ratios.begin(), ratios.end());
  std::printf("set back / forked: %.2f (%.2f to %.2f)\n", median(ratios), *least, *most);
}

}  // namespace
}  // namespace Keelgate

int main(int count, char** arguments) {
  const auto number = [&](int at, int otherwise) {
    return count > at ? std::atoi(arguments[at]) : otherwise;
  };
  Keelgate::compareWays("calls", Keelgate::unpack, number(1, 11), number(2, 2000));
  Keelgate::compareWays("stream", Keelgate::stream, number(1, 11), number(2, 2000));
}
