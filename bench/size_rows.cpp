// SPDX-License-Identifier: Apache-2.0
// What length costs: a large message by itself, and short ones beside it. The messages are data and
// little else, so that nearly all of the time is the way there and back.
#include "plist/writer.h"

#include <keelgate/client.h>

#include <benchmark/benchmark.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdlib>
#include <thread>
#include <vector>

namespace {

using Keelgate::Client;
using Data = std::vector<std::byte>;

constexpr std::size_t mebi = std::size_t{1} << 20;

/// A response whose body has so many bytes.
Data response(std::size_t length) {
  return PropertyList::writeBinary(
      PropertyList::Dictionary{{"c", 1}, {"b", PropertyList::Data(length, std::byte{1})}});
}

Client makeClient(unsigned processes) {
  Client::Options options;
  options.processes = processes;
  options.servicePath = KEELGATE_SERVICE;
  options.largestMessage = 128 * mebi;
  return Client(std::move(options));
}

/// In microseconds.
template <class Call>
double timed(Call call) {
  const auto begin = std::chrono::steady_clock::now();
  call();
  return std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - begin)
      .count();
}

double unpack(Client& client, const Data& message) {
  return timed([&] {
    benchmark::DoNotOptimize(client.unpack<Keelgate::VespCommandWebTunnelResponse>(message));
  });
}

/// The sample below which this share of them lies.
double quantile(std::vector<double> samples, double share) {
  std::sort(samples.begin(), samples.end());
  const auto last = static_cast<double>(samples.size() - 1);
  return samples[static_cast<std::size_t>(last * share)];
}

template <class Move>
void moveAll(Data& bytes, Move move) {
  for (std::size_t done = 0; done < bytes.size();) {
    const ssize_t moved = move(bytes.data() + done, bytes.size() - done);
    if (moved <= 0) std::abort();
    done += static_cast<std::size_t>(moved);
  }
}

/// The least that it could cost: the bytes through a socket to a process that sends them back. In
/// microseconds, one for each time.
std::vector<double> echoes(std::size_t length, int times) {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM, 0, ends) != 0) std::abort();
  Data bytes(length);
  const auto receive = [&](int from) {
    moveAll(bytes, [&](std::byte* to, std::size_t room) { return read(from, to, room); });
  };
  const auto send = [&](int to) {
    moveAll(bytes, [&](const std::byte* from, std::size_t size) { return write(to, from, size); });
  };
  const pid_t pid = fork();
  for (int i = 0; pid == 0 && i < times; ++i) receive(ends[1]), send(ends[1]);
  if (pid == 0) _exit(0);
  std::vector<double> all;
  for (int i = 0; i < times; ++i) {
    all.push_back(timed([&] { send(ends[0]), receive(ends[0]); }));
  }
  waitpid(pid, nullptr, 0);
  close(ends[0]);
  close(ends[1]);
  return all;
}

void large(benchmark::State& state) {
  const auto length = static_cast<std::size_t>(state.range(0)) * mebi;
  const Data message = response(length);
  Client client = makeClient(1);
  std::vector<double> samples;
  for ([[maybe_unused]] auto _ : state) {
    samples.push_back(unpack(client, message));
    state.SetIterationTime(samples.back() / 1e6);
  }
  state.counters["median_us"] = quantile(samples, 0.5);
  state.counters["x_echo"] = quantile(samples, 0.5) / quantile(echoes(length, 20), 0.5);
}

/// Short messages while another thread sends one of 64 MiB after the other through the same client.
void shortBesideLarge(benchmark::State& state) {
  const Data message = response(100);
  Client client = makeClient(2);
  std::vector<double> alone;
  for (int i = 0; i < 2'000; ++i) alone.push_back(unpack(client, message));
  std::atomic<bool> over = false;
  std::thread other([&client, &over, giant = response(64 * mebi)] {
    while (!over) unpack(client, giant);
  });
  std::vector<double> beside;
  for ([[maybe_unused]] auto _ : state) {
    beside.push_back(unpack(client, message));
    state.SetIterationTime(beside.back() / 1e6);
  }
  over = true;
  other.join();
  state.counters["alone_us"] = quantile(alone, 0.5);
  state.counters["alone_99_us"] = quantile(alone, 0.99);
  state.counters["median_us"] = quantile(beside, 0.5);
  state.counters["beside_99_us"] = quantile(beside, 0.99);
}

BENCHMARK(large)->Arg(4)->Arg(64)->UseManualTime()->Iterations(20);
BENCHMARK(shortBesideLarge)->UseManualTime()->Iterations(5'000);

}  // namespace
