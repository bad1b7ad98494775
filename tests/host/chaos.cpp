// SPDX-License-Identifier: Apache-2.0
// Messages from many threads while processes of the service are killed, stopped and faulted at
// random. Every message must have one outcome: its own record, or an error of the host that a
// killed process explains, and not later than a second after its deadline.
//
//     chaos SERVICE MESSAGES THREADS
#include "tests/host/host_testing.h"

#include <atomic>
#include <csignal>
#include <iostream>
#include <map>
#include <mutex>
#include <random>
#include <thread>

namespace Keelgate::Host {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr milliseconds limit(500);
constexpr milliseconds grace(1000);

class Chaos {
 public:
  Chaos(const String& service, Int messages, unsigned threads)
      : messages_(messages), threads_(threads), client_(optionsFor(service, threads)) {}

  /// Whether every outcome was one that is allowed.
  bool run() {
    std::thread killer([this] { killAtRandom(); });
    std::vector<std::thread> senders;
    for (unsigned i = 0; i < threads_; ++i) senders.emplace_back([this] { send(); });
    for (std::thread& sender : senders) sender.join();
    done_ = true;
    killer.join();
    for (const auto& [outcome, count] : outcomes_) std::cout << outcome << ": " << count << '\n';
    std::cout << "signals sent: " << signals_ << ", longest: " << longest_.count() << " ms\n";
    // A signal takes the messages along that are in work, and no other.
    const auto lost = static_cast<std::size_t>(outcomes_["crashed"] + outcomes_["timedOut"]);
    return wrong_ == 0 && longest_ <= limit + grace && records_ > messages_ / 2 &&
           lost <= signals_ * threads_;
  }

 private:
  static Client::Options optionsFor(const String& service, unsigned threads) {
    Client::Options options = fakeOptions();
    options.servicePath = service;
    options.processes = threads;
    options.timeLimit = limit;
    return options;
  }

  void send() {
    for (Int number; (number = next_++) < messages_;) {
      const String text = "<plist><dict><key>c</key><integer>" + std::to_string(number) +
                          "</integer></dict></plist>";
      const auto start = steady_clock::now();
      String outcome = outcomeOf(client_, std::as_bytes(std::span(text)));
      const auto took = std::chrono::duration_cast<milliseconds>(steady_clock::now() - start);
      if (outcome == "record " + std::to_string(number)) outcome = "record";
      const bool allowed = outcome == "record" || outcome == "crashed" || outcome == "timedOut" ||
                           outcome == "startFailed";
      const std::lock_guard lock(mutex_);
      longest_ = std::max(longest_, took);
      ++outcomes_[outcome];
      if (!allowed) ++wrong_;
      if (outcome == "record") ++records_;
    }
  }

  static void collectBelow(const std::filesystem::path& process, std::vector<pid_t>& all) {
    std::error_code gone;
    for (const auto& task : std::filesystem::directory_iterator(process / "task", gone)) {
      std::ifstream list(task.path() / "children");
      for (pid_t pid; list >> pid;) {
        all.push_back(pid);
        collectBelow("/proc/" + std::to_string(pid), all);
      }
    }
  }

  void killAtRandom() {
    std::mt19937 random(std::random_device{}());
    constexpr int signals[] = {SIGKILL, SIGKILL, SIGKILL, SIGSEGV, SIGSYS, SIGSTOP};
    while (!done_) {
      // Where a start takes longer than that, nothing would ever get done.
      const Int before = records_;
      for (int i = 0; i < 200 && records_ < before + 20; ++i) usleep(5'000);
      std::this_thread::sleep_for(milliseconds(10 + random() % 60));
      std::vector<pid_t> all;
      collectBelow("/proc/self", all);
      if (all.empty()) continue;
      kill(all[random() % all.size()], signals[random() % std::size(signals)]);
      ++signals_;
    }
  }

  const Int messages_;
  const unsigned threads_;
  Client client_;
  std::atomic<Int> next_ = 0;
  std::atomic<Int> records_ = 0;
  std::atomic<bool> done_ = false;
  std::size_t signals_ = 0;

  std::mutex mutex_;
  std::map<String, Int> outcomes_;
  Int wrong_ = 0;
  milliseconds longest_{};
};

}  // namespace
}  // namespace Keelgate::Host

int main(int count, char** arguments) {
  using namespace Keelgate::Host;
  if (count != 4) return 2;
  const bool sound =
      Chaos(arguments[1], std::stol(arguments[2]), static_cast<unsigned>(std::stoul(arguments[3])))
          .run();
  return sound && children().empty() ? 0 : 1;
}
