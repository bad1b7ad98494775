// SPDX-License-Identifier: Apache-2.0
// What containment costs. Each figure is a median, and stands beside what the same machine needs in
// the same run for the least that could be done: a fork that exits and is waited for, and a round
// trip of the same bytes over a socket to a process that is already there.
#include "framework/client/worker.h"
#include "framework/contracts/memory_budget.h"
#include "framework/protocol/frames.h"
#include "framework/transport/record_coding.h"

#include <keelgate/client.h>

#include <benchmark/benchmark.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <initializer_list>
#include <iterator>
#include <optional>
#include <vector>

namespace Keelgate {
namespace {

using Micros = std::chrono::duration<double, std::micro>;

Data message() {
  std::ifstream file(KEELGATE_EXAMPLES "/command-response.bplist", std::ios::binary);
  const std::vector<char> bytes{std::istreambuf_iterator<char>(file), {}};
  const Bytes view = std::as_bytes(std::span(bytes));
  return {view.begin(), view.end()};
}

template <class Call>
double timed(Call call) {
  const auto start = Clock::now();
  call();
  return Micros(Clock::now() - start).count();
}

double median(std::vector<double> samples) {
  const auto middle = samples.begin() + static_cast<std::ptrdiff_t>(samples.size() / 2);
  std::nth_element(samples.begin(), middle, samples.end());
  return *middle;
}

template <class Call>
double medianOf(int n, Call call) {
  std::vector<double> samples;
  samples.reserve(static_cast<std::size_t>(n));
  for (int i = 0; i < n; ++i) samples.push_back(timed(call));
  return median(std::move(samples));
}

using Isolation = Client::Isolation;

Client::Options options(std::size_t messagesPerProcess, Isolation isolation = Isolation::fork) {
  Client::Options options;
  options.isolation = isolation;
  options.processes = 1;
  options.messagesPerProcess = messagesPerProcess;
  options.servicePath = KEELGATE_SERVICE;
  return options;
}

/// Of the body that a service answers the message with.
std::size_t replyLength() {
  Client client(options(1));
  return Transport::lendRecord(client.unpack<VespCommandResponse>(message())).joined().size();
}

double bareFork() {
  static const double result = medianOf(500, [] {
    const pid_t pid = fork();
    if (pid == 0) _exit(0);
    waitpid(pid, nullptr, 0);
  });
  return result;
}

/// A child answers what it gets with as many bytes as a service would.
double bareRoundTrip() {
  static const double result = [] {
    const Data request(sizeof(Protocol::RequestHeader) + message().size());
    const Data reply(sizeof(Protocol::ReplyHeader) + replyLength());
    int ends[2];
    if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends) != 0) std::abort();
    const pid_t pid = fork();
    if (pid == 0) close(ends[0]);
    Data buffer(4096);
    while (pid == 0) {
      if (read(ends[1], buffer.data(), buffer.size()) <= 0) _exit(0);
      if (write(ends[1], reply.data(), reply.size()) <= 0) _exit(0);
    }
    close(ends[1]);
    const double trip = medianOf(2000, [&] {
      if (write(ends[0], request.data(), request.size()) <= 0) std::abort();
      if (read(ends[0], buffer.data(), buffer.size()) <= 0) std::abort();
    });
    close(ends[0]);
    waitpid(pid, nullptr, 0);
    return trip;
  }();
  return result;
}

/// A client and a worker that are in full swing: what a service without C6 would cost.
double warmRoundTrip() {
  static const double result = [] {
    Client client(options(1'000'000'000));
    const Data bytes = message();
    return medianOf(5000,
                    [&] { benchmark::DoNotOptimize(client.unpack<VespCommandResponse>(bytes)); });
  }();
  return result;
}

/// Runs the call with a pause behind each, in which the service can get ready for the next one.
template <class Call, class Before = void (*)()>
void measure(
    benchmark::State& state, std::chrono::microseconds pause, Call call, Before before = [] {}) {
  std::vector<double> samples;
  for ([[maybe_unused]] auto _ : state) {
    before();
    samples.push_back(timed(call));
    state.SetIterationTime(samples.back() / 1e6);
    if (pause.count() > 0) usleep(static_cast<useconds_t>(pause.count()));
  }
  const double middle = median(std::move(samples));
  state.counters["median_us"] = middle;
  state.counters["x_fork"] = middle / bareFork();
  state.counters["x_trip"] = middle / bareRoundTrip();
  state.counters["x_warm"] = middle / warmRoundTrip();
}

void bareForkExitWait(benchmark::State& state) {
  measure(state, {}, [] {
    const pid_t pid = fork();
    if (pid == 0) _exit(0);
    waitpid(pid, nullptr, 0);
  });
}

void freshWorkerWithoutSpare(benchmark::State& state) {
  DescriptorRegistry registry(16);
  const ServiceSettings settings{.path = KEELGATE_SERVICE,
                                 .socket = {},
                                 .socketUser = {},
                                 .requireLayers = false,
                                 .forks = true,
                                 .messagesPerWorker = 1,
                                 .cpuSecondsPerWorker = 5,
                                 .maximumWorkers = 8};
  const auto service = std::make_shared<ServiceProcess>(settings, registry);
  for (; service->state() == ServiceProcess::State::starting; service->readNews()) usleep(1000);
  const Data bytes = message();
  const OutgoingMessage request{
      .record = recordNumber<VespCommandResponse>, .command = 0, .service = {}, .message = bytes};
  measure(state, std::chrono::milliseconds(2), [&] {
    service->readNews();
    Worker worker(service, *service->fork(shortMessage));
    Exchange exchange(worker.channel(), worker.nextSequence());
    exchange.add(request);
    Exchange::State reached{};
    while ((reached = exchange.advance()) <= Exchange::State::receiving) {
      waitFor(exchange.wait(Deadline::max()));
    }
    if (reached != Exchange::State::answered) state.SkipWithError("no reply");
    worker.finish();
  });
}

void clientCall(benchmark::State& state, std::size_t messagesPerProcess, Isolation isolation,
                std::chrono::microseconds pause) {
  Client client(options(messagesPerProcess, isolation));
  const Data bytes = message();
  client.unpack<VespCommandResponse>(bytes);
  measure(state, pause,
          [&] { benchmark::DoNotOptimize(client.unpack<VespCommandResponse>(bytes)); });
}

double processorMicros() {
  double sum = 0;
  for (const auto who : {RUSAGE_SELF, RUSAGE_CHILDREN}) {
    rusage used{};
    getrusage(who, &used);
    for (const timeval& part : {used.ru_utime, used.ru_stime}) {
      sum += static_cast<double>(part.tv_sec) * 1e6 + static_cast<double>(part.tv_usec);
    }
  }
  return sum;
}

/// Many messages in one call of one thread: from bytes to records, without JSON.
void batch(benchmark::State& state, std::size_t messagesPerProcess, Isolation isolation) {
  const Data bytes = message();
  // A fresh process takes a hundred times as long.
  const std::size_t number = messagesPerProcess == 1 ? 2'000 : 20'000;
  const std::vector<Client::Request> requests(number, Client::Request{.message = bytes});
  const auto count = static_cast<double>(requests.size());
  for ([[maybe_unused]] auto _ : state) {
    const double used = processorMicros();
    double wall = 0;
    {
      Client client(options(messagesPerProcess, isolation));
      wall = timed([&] {
        client.unpackBatch<VespCommandResponse>(
            requests, [](std::size_t, const Outcome<VespCommandResponse>& outcome) {
              if (!outcome.hasRecord()) std::abort();
            });
      });
    }
    // The service has ended and been waited for, so that its processes count.
    state.counters["processor_us"] = (processorMicros() - used) / count;
    state.counters["wall_us"] = wall / count;
    state.SetIterationTime(wall / 1e6);
  }
}

void coldStart(benchmark::State& state) {
  const Data bytes = message();
  std::optional<Client> client;
  // Ending the one before is not counted.
  measure(
      state, {},
      [&] {
        client.emplace(options(1));
        benchmark::DoNotOptimize(client->unpack<VespCommandResponse>(bytes));
      },
      [&] { client.reset(); });
}

#ifdef KEELGATE_OBEDIENT_SERVICE
/// From the deadline of a message whose worker spins until its caller has the error.
void pastTheDeadline(benchmark::State& state) {
  constexpr std::chrono::milliseconds limit(20);
  Client::Options its = options(1);
  its.servicePath = KEELGATE_OBEDIENT_SERVICE;
  its.timeLimit = limit;
  Client client(its);
  constexpr std::string_view order = "spin";
  std::vector<double> samples;
  for ([[maybe_unused]] auto _ : state) {
    samples.push_back(timed([&] {
                        try {
                          client.unpack<VespCommandResponse>(std::as_bytes(std::span(order)));
                        } catch (const HostError&) {
                        }
                      }) -
                      Micros(limit).count());
    state.SetIterationTime(samples.back() / 1e6);
  }
  state.counters["longest_us"] = *std::max_element(samples.begin(), samples.end());
  state.counters["median_us"] = median(std::move(samples));
}
BENCHMARK(pastTheDeadline)->UseManualTime()->Iterations(100);
#endif

/// In kilobytes. Resident counts a page in each process that has it mapped; proportional shares it
/// out among them, and is 0 where only root may ask.
struct Memory {
  std::size_t resident = 0;
  std::size_t proportional = 0;
};

/// Of all processes below this one.
Memory memoryBelow(const std::filesystem::path& process) {
  Memory sum;
  for (const auto& task : std::filesystem::directory_iterator(process / "task")) {
    std::ifstream list(task.path() / "children");
    for (std::string pid; list >> pid;) {
      const auto child = std::filesystem::path("/proc") / pid;
      std::ifstream sizes(child / "statm");
      std::size_t all = 0;
      std::size_t resident = 0;
      sizes >> all >> resident;
      std::ifstream details(child / "smaps_rollup");
      std::size_t proportional = 0;
      for (std::string word; details >> word && word != "Pss:";) continue;
      details >> proportional;
      const Memory below = memoryBelow(child);
      sum.resident += resident * 4 + below.resident;
      sum.proportional += proportional + below.proportional;
    }
  }
  return sum;
}

void idleService(benchmark::State& state) {
  Client client(options(1));
  client.unpack<VespCommandResponse>(message());
  usleep(50'000);
  for ([[maybe_unused]] auto _ : state) state.SetIterationTime(1e-9);
  const Memory memory = memoryBelow("/proc/self");
  state.counters["resident_KiB"] = static_cast<double>(memory.resident);
  state.counters["proportional_KiB"] = static_cast<double>(memory.proportional);
}

BENCHMARK(bareForkExitWait)->UseManualTime()->Iterations(500);
BENCHMARK(freshWorkerWithoutSpare)->UseManualTime()->Iterations(500);
constexpr auto forked = Isolation::fork;
constexpr auto rewound = Isolation::rewind;
constexpr std::chrono::milliseconds pause{2};
constexpr std::chrono::milliseconds none{0};
constexpr std::size_t endless = 1'000'000'000;
BENCHMARK_CAPTURE(clientCall, spareForkedAhead, 1, forked, pause)->UseManualTime()->Iterations(500);
BENCHMARK_CAPTURE(clientCall, spareRewound, 1, rewound, pause)->UseManualTime()->Iterations(500);
BENCHMARK_CAPTURE(clientCall, oneAfterTheOtherForked, 1, forked, none)
    ->UseManualTime()
    ->Iterations(2000);
BENCHMARK_CAPTURE(clientCall, oneAfterTheOtherRewound, 1, rewound, none)
    ->UseManualTime()
    ->Iterations(2000);
BENCHMARK_CAPTURE(clientCall, warm, endless, forked, none)->UseManualTime()->Iterations(5000);
BENCHMARK_CAPTURE(batch, forked, 1, forked)->UseManualTime()->Iterations(1);
BENCHMARK_CAPTURE(batch, rewound, 1, rewound)->UseManualTime()->Iterations(1);
BENCHMARK_CAPTURE(batch, reused, endless, forked)->UseManualTime()->Iterations(1);
BENCHMARK(coldStart)->UseManualTime()->Iterations(50);
BENCHMARK(idleService)->UseManualTime()->Iterations(1);

}  // namespace
}  // namespace Keelgate

BENCHMARK_MAIN();
