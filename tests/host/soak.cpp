// SPDX-License-Identifier: Apache-2.0
// One crashing message after the other. Afterwards the application has the descriptors, children,
// threads and, nearly, the memory that it had before.
//
//     soak SERVICE MESSAGES THREADS [MESSAGE]
//
// The message is what makes a worker of that service crash; by default, one of the fake service.
#include "tests/host/host_testing.h"

#include <sys/prctl.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <csignal>
#include <iostream>
#include <thread>

namespace Keelgate::Host {
namespace {

struct Holdings {
  std::size_t descriptors = openDescriptors();
  std::size_t children = Host::children().size();
  std::ptrdiff_t threads = [] {
    std::ptrdiff_t count = 0;
    // One that was joined may be listed for a moment more.
    for (int i = 0; i < 100 && count != 1; ++i) {
      if (i > 0) usleep(10'000);
      count = std::distance(std::filesystem::directory_iterator("/proc/self/task"), {});
    }
    return count;
  }();
  // statm counts roughly where there are many processors.
  std::size_t residentKiB = [] {
    std::ifstream rollup("/proc/self/smaps_rollup");
    std::size_t resident = 0;
    for (String word; rollup >> word && word != "Rss:";) continue;
    rollup >> resident;
    return resident;
  }();

  void print(const char* when) const {
    std::cout << when << ": " << descriptors << " descriptors, " << children << " children, "
              << threads << " threads, " << residentKiB << " KiB\n";
  }
};

/// How many of the messages had another outcome than a crash.
std::size_t crash(Client& client, Bytes message, long messages, unsigned threads) {
  std::atomic<long> next = 0;
  std::atomic<std::size_t> others = 0;
  std::vector<std::thread> senders;
  for (unsigned i = 0; i < threads; ++i) {
    senders.emplace_back([&] {
      while (next++ < messages) {
        if (outcomeOf(client, message) != "crashed") ++others;
      }
    });
  }
  for (std::thread& sender : senders) sender.join();
  return others;
}

bool soak(const String& service, long messages, unsigned threads, Bytes message) {
  Client::Options options = fakeOptions();
  options.servicePath = service;
  options.processes = threads;
  constexpr long warmUp = 50;
  std::size_t others = 0;
  {
    Client client(options);
    others += crash(client, message, warmUp, threads);
  }
  const Holdings before;
  std::size_t meanwhile = 0;
  {
    Client client(options);
    others += crash(client, message, warmUp, threads);
    const Holdings early;
    others += crash(client, message, messages, threads);
    const Holdings late;
    early.print("after the first");
    late.print("after the last");
    meanwhile = std::max(late.descriptors, early.descriptors) - early.descriptors +
                std::max(late.children, early.children) - early.children;
  }
  const Holdings after;
  before.print("before");
  after.print("after");
  std::cout << "other outcomes: " << others << '\n';
#ifdef KEELGATE_UNSEALED
  // A sanitizer remembers what was freed.
  constexpr std::size_t slack = 65'536;
#else
  constexpr std::size_t slack = 1024;
#endif
  // Workers come and go: two that are kept ready for each thread, and a service that ends.
  return others == 0 && meanwhile <= 2 * threads + 3 && after.descriptors == before.descriptors &&
         after.children == before.children && after.threads == before.threads &&
         after.residentKiB <= before.residentKiB + slack;
}

}  // namespace
}  // namespace Keelgate::Host

int main(int count, char** arguments) {
  using namespace Keelgate::Host;
  if (count < 4) return 2;
  // As pid 1 of a container: what the service leaves behind would be found among our children.
  prctl(PR_SET_CHILD_SUBREAPER, 1);
  const Script script = Script().then(Op::raise, SIGSEGV);
  const std::string_view text(count == 5 ? arguments[4] : "");
  return soak(arguments[1], std::stol(arguments[2]),
              static_cast<unsigned>(std::stoul(arguments[3])),
              text.empty() ? Keelgate::Bytes(script) : std::as_bytes(std::span(text)))
             ? 0
             : 1;
}
