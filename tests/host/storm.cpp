// SPDX-License-Identifier: Apache-2.0
// Messages from many threads while workers fail. Every message has one outcome: its own record, or
// an error of the host that a failure explains, not later than a second after its deadline.
// Afterwards the application has the descriptors, children and threads that it had before.
//
//     storm SERVICE MESSAGES THREADS          processes are killed, stopped and faulted at random
//     storm SERVICE MESSAGES THREADS ORDER    each message is an order to crash
//
// With "fork" in front of SERVICE no worker is rewound.
#include "tests/host/host_testing.h"

#include <sys/prctl.h>

#include <array>
#include <iostream>
#include <map>
#include <mutex>
#include <random>

namespace Keelgate::Host {
namespace {

/// Descriptors, children and threads.
using Holdings = std::array<std::ptrdiff_t, 3>;

Holdings holdings() {
  // One that was joined may be listed for a moment more.
  comesTrue([] { return entriesOf("/proc/self/task") == 1; });
  const Holdings held{openDescriptors(), std::ssize(children()), entriesOf("/proc/self/task")};
  std::cout << "held: " << held[0] << ' ' << held[1] << ' ' << held[2] << '\n';
  return held;
}

class Storm {
 public:
  Storm(Client& client, unsigned threads, String order)
      : client_(client), threads_(threads), order_(std::move(order)) {}

  /// Whether every outcome was one that is allowed.
  bool send(Int messages) {
    messages_ = messages;
    done_ = !order_.empty();
    std::thread killer([this] { killAtRandom(); });
    std::vector<std::thread> senders;
    for (unsigned i = 0; i < threads_; ++i) senders.emplace_back([this] { send(); });
    for (std::thread& sender : senders) sender.join();
    done_ = true;
    killer.join();
    for (const auto& [outcome, count] : outcomes_) std::cout << outcome << ": " << count << '\n';
    std::cout << "signals sent: " << signals_ << ", longest: " << longest_.count() << " ms\n";
    // A signal takes the messages along that are in work, and no other.
    const Int lost = outcomes_["crashed"] + outcomes_["timedOut"];
    return wrong_ == 0 && longest_ <= limit + milliseconds(1000) &&
           (!order_.empty() || (records_ > messages / 2 && lost <= signals_ * Int{threads_}));
  }

  static constexpr milliseconds limit{500};

 private:
  void send() {
    for (Int number; (number = next_++) < messages_;) {
      const String text = !order_.empty()
                              ? order_
                              : "<plist><dict><key>c</key><integer>" + std::to_string(number) +
                                    "</integer></dict></plist>";
      const auto start = steady_clock::now();
      String outcome = outcomeOf(client_, bytesOf(text));
      const auto took = std::chrono::duration_cast<milliseconds>(steady_clock::now() - start);
      if (outcome == "record " + std::to_string(number)) outcome = "record";
      const bool explained =
          outcome == "record" || outcome == "timedOut" || outcome == "startFailed";
      const std::lock_guard lock(mutex_);
      longest_ = std::max(longest_, took);
      ++outcomes_[outcome];
      if (outcome != "crashed" && !(order_.empty() && explained)) ++wrong_;
      if (outcome == "record") ++records_;
    }
  }

  static void collectBelow(pid_t process, std::vector<pid_t>& all) {
    for (const pid_t child : children(process)) {
      all.push_back(child);
      collectBelow(child, all);
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
      collectBelow(getpid(), all);
      if (all.empty()) continue;
      kill(all[random() % all.size()], signals[random() % std::size(signals)]);
      ++signals_;
    }
  }

  Client& client_;
  const unsigned threads_;
  const String order_;
  Int messages_ = 0;
  std::atomic<Int> next_ = 0;
  std::atomic<Int> records_ = 0;
  std::atomic<bool> done_ = false;
  Int signals_ = 0;

  std::mutex mutex_;
  std::map<String, Int> outcomes_;
  Int wrong_ = 0;
  milliseconds longest_{};
};

bool runStorm(Client::Isolation isolation, const String& service, Int messages, unsigned threads,
              const String& order) {
  const auto limit = order.empty() ? Storm::limit : milliseconds(20'000);
  Client::Options options = optionsFor(service, limit, threads);
  options.isolation = isolation;
  // As pid 1 of a container: what the service leaves behind would be found among our children.
  // Where launchers are killed, that is what they were there for.
  if (!order.empty()) prctl(PR_SET_CHILD_SUBREAPER, 1);
  const auto warmUp = [&](Client& client) {
    Storm(client, threads, order).send(100);
  };
  {
    Client client(options);
    warmUp(client);
  }
  const Holdings before = holdings();
  bool sound = false;
  {
    Client client(options);
    warmUp(client);
    const Holdings early = holdings();
    sound = Storm(client, threads, order).send(messages);
    const Holdings late = holdings();
    // Workers come and go: two that are kept ready for each thread, and a service that ends.
    const auto more = late[0] - early[0] + late[1] - early[1];
    sound = sound && more <= 2 * std::ptrdiff_t{threads} + 3;
  }
  return holdings() == before && sound;
}

}  // namespace
}  // namespace Keelgate::Host

int main(int count, char** arguments) {
  const bool forks = std::string_view(arguments[1]) == "fork";
  if (forks) ++arguments, --count;
  const auto isolation =
      forks ? Keelgate::Client::Isolation::fork : Keelgate::Client::Isolation::rewind;
  const auto threads = static_cast<unsigned>(std::stoul(arguments[3]));
  const Keelgate::Int messages = std::stol(arguments[2]);
  return Keelgate::Host::runStorm(isolation, arguments[1], messages, threads,
                                  count > 4 ? arguments[4] : "")
             ? 0
             : 1;
}
