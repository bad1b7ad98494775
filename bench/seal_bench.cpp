// SPDX-License-Identifier: Apache-2.0
/// What the seal costs, beside what forking costs anyway in the same run.
///
/// A fresh worker is asked for, answers, and its end is awaited: nothing is hidden behind the
/// reply.
#include "tests/containment/raw_client.h"

#include <benchmark/benchmark.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace Keelgate::Test;

void bareFork(benchmark::State& state) {
  for (auto _ : state) {
    const pid_t child = fork();
    if (child == 0) _exit(0);
    waitpid(child, nullptr, 0);
  }
}
BENCHMARK(bareFork)->UseRealTime();

/// Until the reply; the worker's end is awaited outside of the time.
void freshWorker(benchmark::State& state) {
  RawClient service(OBEDIENT_SERVICE);
  for (auto _ : state) {
    const int channel = service.fork(0);
    sendOrder(channel, "answer");
    benchmark::DoNotOptimize(receiveReply(channel));
    state.PauseTiming();
    close(channel);
    service.end(0);
    state.ResumeTiming();
  }
}
BENCHMARK(freshWorker)->UseRealTime();

void freshWorkerUntilItsEnd(benchmark::State& state) {
  RawClient service(OBEDIENT_SERVICE);
  for (auto _ : state) benchmark::DoNotOptimize(service.obey("answer"));
}
BENCHMARK(freshWorkerUntilItsEnd)->UseRealTime();

/// The worker was asked for before the message came.
void spareWorker(benchmark::State& state) {
  RawClient service(OBEDIENT_SERVICE);
  for (auto _ : state) {
    state.PauseTiming();
    const int channel = service.fork(0);
    usleep(1000);
    state.ResumeTiming();
    sendOrder(channel, "answer");
    benchmark::DoNotOptimize(receiveReply(channel));
    state.PauseTiming();
    close(channel);
    service.end(0);
    state.ResumeTiming();
  }
}
BENCHMARK(spareWorker)->UseRealTime();

void warmWorker(benchmark::State& state) {
  RawOptions options;
  options.messages = 1'000'000'000;
  options.cpuSeconds = 3600;
  RawClient service(OBEDIENT_SERVICE, options);
  const int channel = service.fork(0);
  std::uint32_t sequence = 0;
  for (auto _ : state) {
    sendOrder(channel, "answer", sequence++);
    benchmark::DoNotOptimize(receiveReply(channel));
  }
  close(channel);
}
BENCHMARK(warmWorker)->UseRealTime();

void coldStart(benchmark::State& state) {
  for (auto _ : state) RawClient service(OBEDIENT_SERVICE);
}
BENCHMARK(coldStart)->UseRealTime();

}  // namespace

BENCHMARK_MAIN();
