// SPDX-License-Identifier: Apache-2.0
// What a client tells a zygote and makes of its frames, step by step: the zygote is this test.
#include "framework/client/call_queue.h"
#include "framework/contracts/memory_budget.h"
#include "framework/protocol/control_frames.h"
#include "tests/host/host_testing.h"

#include <gtest/gtest.h>

#include <sys/socket.h>

#include <array>
#include <deque>
#include <map>

namespace Keelgate::Host {
namespace {

using Protocol::ControlKind;
using State = ServiceProcess::State;
using Leaving = ServiceProcess::Leaving;
using Told = std::tuple<ControlKind, std::uint32_t, std::uint64_t>;

constexpr Told nothing{};

class Zygote : public testing::Test {
 protected:
  Zygote() {
    listen(listener_, 8);
    options_.socket = path_;
  }
  ~Zygote() override {
    while (!ends_.empty()) hangUp();
    for (const auto& [slot, channel] : channels_) close(channel);
    close(listener_);
    std::filesystem::remove(path_);
  }

  /// Answers the hello of the service that has connected last; gives its numbers, or nothing.
  Optional<std::array<std::uint64_t, 4>> greet(ControlKind answer = ControlKind::ready) {
    pollfd entry{.fd = listener_, .events = POLLIN, .revents = 0};
    if (poll(&entry, 1, 0) != 1) return std::nullopt;
    ends_.push_back(accept(listener_, nullptr, nullptr));
    EXPECT_EQ(std::get<1>(next()), 0U);
    say(answer, 0, {~std::uint64_t{0}, Protocol::ownVersion()});
    return last_.numbers;
  }
  void say(ControlKind kind, std::uint32_t slot, std::array<std::uint64_t, 4> numbers = {}) {
    const auto frame = Protocol::makeControlFrame(kind, slot, numbers);
    static_cast<void>(sendControl(ends_.back(), frame, -1, Protocol::Waiting::no));
  }
  /// What it has been told, the worker's end of a channel kept; nothing when there is no more.
  Told next() {
    int channel = -1;
    last_ = {};
    if (receiveControl(ends_.back(), last_, channel, Protocol::Waiting::no) !=
        Protocol::Transfer::complete) {
      return nothing;
    }
    if (channel >= 0) channels_[last_.slot] = channel;
    return {last_.kind, last_.slot, last_.numbers[0]};
  }
  std::size_t forksTold() {
    std::size_t count = 0;
    for (; next() != nothing; ++count) EXPECT_EQ(last_.kind, ControlKind::fork);
    return count;
  }
  Supervisor::Service demanded(milliseconds limit = milliseconds(20'000)) {
    const auto service = supervisor_.demand(deadlineAfter(limit));
    const auto* const running = std::get_if<Supervisor::Service>(&service);
    return running == nullptr ? nullptr : *running;
  }
  bool isOpen(std::size_t end) const { return signOf(ends_[end]) == WorkerSign::quiet; }
  void hangUp() {
    close(ends_.back());
    ends_.pop_back();
  }

  /// The slots are looked at when some time has passed.
  void look(ServiceProcess& service) {
    now_ = std::max(now_, Clock::now()) + milliseconds(500);
    service.readNews(now_);
  }

  const String path_ = temporaryPath("zygote");
  const int listener_ = boundTo(path_);
  DescriptorRegistry registry_{64};
  ServiceSettings settings_{.path = fakeService("stuck"),
                            .socket = path_,
                            .socketUser = {},
                            .requireLayers = false,
                            .forks = true,
                            .messagesPerWorker = 7,
                            .cpuSecondsPerWorker = 5,
                            .maximumWorkers = 3};
  Client::Options options_ = fakeOptions();
  Deadline now_{};
  std::vector<int> ends_;
  std::map<std::uint32_t, int> channels_;
  Protocol::ControlFrame last_{};
  Supervisor supervisor_{settings_, [](std::string_view) {}, registry_};
};

/// Whoever has left is given its time, unless one was killed since it stayed: the slots are few.
TEST_F(Zygote, TheEndOfAWorkerMeansWhatItsSlotStoodFor) {
  enum { held, leaving, overdue, stayed, killed };
  constexpr int never = -1;
  for (const int stage : {held, leaving, overdue, stayed, killed}) {
    for (const int status : {0, 3 << 8, SIGKILL, SIGSEGV, never}) {
      ServiceProcess service(settings_, registry_);
      EXPECT_EQ(greet(), (std::array<std::uint64_t, 4>{7, 5, 1, 0}));
      service.readNews();
      ASSERT_EQ(service.state(), State::running);
      std::deque<ServiceProcess::Forked> workers;
      const auto fork = [&](std::uint32_t slot) {
        auto forked = service.fork(1000 + slot);
        ASSERT_TRUE(forked && forked->slot == slot) << stage << ' ' << status;
        EXPECT_EQ(next(), Told(ControlKind::fork, slot, 1000 + slot));
        workers.push_back(std::move(*forked));
      };
      fork(0);
      fork(1);
      if (stage != held) service.release(0, stage == killed ? Leaving::killed : Leaving::byItself);
      for (int looks = leaving; looks < stage && stage != killed; ++looks) look(service);
      const bool isOurs = stage == stayed || stage == killed;
      EXPECT_EQ(next(), isOurs ? Told(ControlKind::kill, 0, 0) : nothing) << stage;
      EXPECT_FALSE(service.exitOf(0));

      say(ControlKind::exit, 0,
          {static_cast<unsigned>(std::max(status, 0)), 0, 0, status == never});
      service.readNews();
      const Deadline noted = Clock::now();
      const bool isHarmless = status <= 0 || (status == SIGKILL && isOurs);
      EXPECT_EQ(service.state(), isHarmless ? State::running : State::retired) << stage << status;
      const auto exit = service.exitOf(0);
      ASSERT_EQ(exit.has_value(), stage == held);
      if (exit) {
        EXPECT_TRUE(exit->status == std::max(status, 0) && exit->neverStarted == (status == never));
        service.release(0, Leaving::killed);
      }
      fork(0);
      fork(2);
      service.release(1, Leaving::byItself);
      EXPECT_FALSE(service.fork(1));
      const bool isImpatient = stage == stayed && (status == SIGKILL || status == SIGSEGV);
      const Told told = next();
      if (Clock::now() > noted + milliseconds(90)) continue;
      EXPECT_EQ(told, isImpatient ? Told(ControlKind::kill, 1, 0) : nothing) << stage << status;
    }
  }
}

TEST_F(Zygote, IsLostWhenItSaysWhatItShouldNot) {
  const std::pair<ControlKind, std::uint32_t> rows[] = {
      {ControlKind::exit, 3},  {ControlKind::exit, 1},    {ControlKind::exit, 2},
      {ControlKind::ready, 0}, {ControlKind::refused, 0}, {ControlKind::fork, 0}};
  for (const auto& [kind, slot] : rows) {
    ServiceProcess service(settings_, registry_);
    greet();
    service.readNews();
    const auto held = service.fork(1), ended = service.fork(1);
    say(ControlKind::exit, 1);
    service.readNews();
    EXPECT_EQ(service.state(), State::running);
    say(kind, slot);
    service.readNews();
    EXPECT_EQ(service.state(), State::lost) << static_cast<int>(kind) << slot;
    EXPECT_FALSE(service.fork(1));
    service.retire();
    EXPECT_EQ(service.state(), State::lost);
  }
  ServiceProcess service(settings_, registry_);
  greet();
  service.readNews();
  hangUp();
  EXPECT_FALSE(service.fork(1));
  EXPECT_EQ(service.state(), State::lost);
  ServiceProcess odd(settings_, registry_);
  greet(ControlKind::exit);
  odd.readNews();
  EXPECT_TRUE(odd.state() == State::lost && odd.startFailure() && odd.startFailure()->mayPass);
  ServiceProcess mute(settings_, registry_);
  mute.readNews(mute.startedAt() + startPatience - milliseconds(1));
  EXPECT_EQ(mute.state(), State::starting);
  mute.readNews(mute.startedAt() + startPatience);
  EXPECT_TRUE(mute.state() == State::lost && mute.startFailure() && mute.startFailure()->mayPass);
}

TEST_F(Zygote, IsToldLaterWhatItHasNoRoomFor) {
  ServiceProcess service(settings_, registry_);
  greet();
  service.readNews();
  const auto roomOf = [](const auto& worker) {
    int size = 0;
    socklen_t length = sizeof size;
    getsockopt(worker->channel.get(), SOL_SOCKET, SO_SNDBUF, &size, &length);
    return size;
  };
  const auto held = service.fork(shortMessage);
  // For long messages as wide as the system lets it be.
  EXPECT_GT(roomOf(service.fork(shortMessage + 1)), roomOf(held));
  for (int i = 0; i < 20'000; ++i) service.release(0, Leaving::killed);
  EXPECT_FALSE(service.fork(1));
  EXPECT_EQ(service.state(), State::running);
  while (next() != nothing) continue;
  look(service);
  EXPECT_EQ(next(), Told(ControlKind::kill, 0, 0));
}

/// One that does not see its channel closed, and was stopped: that it is killed is the last means.
TEST_F(Zygote, HasTimeToEndAndIsAskedTo) {
  settings_.socket.clear();
  ServiceProcess service(settings_, registry_);
  const auto isRunning = [&] {
    return service.readNews(), service.state() == State::running;
  };
  EXPECT_TRUE(comesTrue(isRunning));
  // The file that was looked at, whatever has its path by now: a program that is executed by its
  // descriptor is called by the number.
  const pid_t launcher = *children().begin();
  String name;
  std::ifstream("/proc/" + std::to_string(launcher) + "/comm") >> name;
  EXPECT_EQ(name, "0");
  kill(launcher, SIGSTOP);
  const auto start = Clock::now();
  const ServiceProcess::Patience patience{
      .closed = milliseconds(200), .asked = milliseconds(60'000), .killed = milliseconds(60'000)};
  EXPECT_TRUE(comesTrue([&] { return service.end(patience); }));
  EXPECT_GE(Clock::now() - start, patience.closed);
}

TEST_F(Zygote, AnotherIsReadyForWhoeverIsMoreThanASingleCall) {
  EXPECT_EQ(demanded(), nullptr);
  EXPECT_EQ(supervisor_.current(), nullptr);
  // It is still starting when the time is up.
  EXPECT_EQ(outcomeOf([&] { return demanded(milliseconds(0)) != nullptr; }), "timedOut");
  greet();
  Supervisor::Service first = demanded();
  ASSERT_TRUE(first && supervisor_.isCurrent(first.get()));
  // As a fork of the application has it: it does not keep the service.
  const int copy = dup(first->waitForNews({}).descriptor);
  supervisor_.noteReply(*first);
  supervisor_.tidy();
  EXPECT_FALSE(greet());
  // As long as there is no other, this one stays.
  for (std::uint64_t i = 1; i <= repliesPerLayout; ++i) supervisor_.noteReply(*first);
  EXPECT_EQ(first->state(), State::running);
  supervisor_.tidy();
  EXPECT_TRUE(greet());
  supervisor_.tidy();
  EXPECT_FALSE(greet()) << "one is enough";
  supervisor_.noteReply(*first);
  EXPECT_EQ(first->state(), State::retired);
  EXPECT_EQ(supervisor_.current(), nullptr);
  const Supervisor::Service second = demanded();
  ASSERT_TRUE(second && second != first && !supervisor_.isCurrent(first.get()));
  // Not ended as long as somebody has it.
  supervisor_.tidy();
  EXPECT_TRUE(isOpen(0));
  first.reset();
  supervisor_.tidy();
  EXPECT_FALSE(isOpen(0));
  close(copy);
  // The next one comes to nothing, and is not tried again at once; then there is none.
  EXPECT_TRUE(greet());
  hangUp();
  supervisor_.noteReply(*second);
  second->retire();
  supervisor_.tidy();
  EXPECT_TRUE(greet()) << "for the one that was retired";
  EXPECT_NE(demanded(), nullptr);
  supervisor_.tidy();
  EXPECT_FALSE(greet()) << "beside it";
}

/// Each death before a first answer makes the wait longer, and an answer ends that.
TEST_F(Zygote, ThatDiesIsReplacedAtOnceAsLongAsAnswersCome) {
  const auto start = Clock::now();
  for (int i = 0; i < 9; ++i) {
    Supervisor::Service service;
    EXPECT_TRUE(comesTrue([&] { return greet(), service = demanded(); }));
    if (i % 3 == 2) supervisor_.noteReply(*service);
    hangUp();
    service->readNews();
  }
  EXPECT_LT(Clock::now() - start, milliseconds(2000));
  // Not for what is over.
  EXPECT_EQ(outcomeOf([&] { return demanded(milliseconds(0)) != nullptr; }), "timedOut");
}

/// The kernel's limit stands behind the time limit: in whole seconds, and for all of its messages.
TEST_F(Zygote, IsToldWhatBoundsAWorker) {
  constexpr std::size_t day = 86'400;
  const std::tuple<milliseconds, std::size_t, std::uint64_t> rows[] = {
      {milliseconds(-1), 1, 1},          {milliseconds(0), 1, 1},
      {milliseconds(1001), 0, 3},        {milliseconds(1500), 4, 12},
      {milliseconds::max(), 1, day + 1}, {milliseconds(0), day + 9, day}};
  for (const auto& [limit, messages, seconds] : rows) {
    options_.timeLimit = limit;
    options_.messagesPerProcess = messages;
    Pool pool(options_);
    EXPECT_TRUE(std::holds_alternative<Wait>(pool.take(10, false, Deadline::max())));
    const auto told = *greet();
    EXPECT_TRUE(told[1] == seconds && told[2] == (Testing::forksAlone() ? 1 : 0)) << seconds;
  }
  // Of the processes a quarter is kept for small messages, and more of them there are not.
  for (const auto& [processes, large] :
       {std::pair(1U, 1), {2U, 1}, {4U, 3}, {5U, 3}, {8U, 6}, {9U, 6}}) {
    options_.processes = processes;
    Pool pool(options_);
    std::deque<FairSemaphore::Permit> permits;
    for (int i = 0; i < 9; ++i) permits.emplace_back(pool.permits(), pool.isLarge(4U << 20));
    EXPECT_EQ(std::ranges::count_if(permits, &FairSemaphore::Permit::isAdmitted), large);
  }
  options_.processes = Client::Options::maximumProcesses + 1;
  EXPECT_EQ(processesFor(options_), Client::Options::maximumProcesses);
}

TEST_F(Zygote, WorkersAreForkedAheadAndUsedWhileTheyAreQuiet) {
  const auto soon = deadlineAfter(milliseconds(20'000));
  for (const std::size_t messages : {1U, 3U}) {
    const std::size_t each = messages == 1 ? 2 : 1;
    // None is one.
    options_.messagesPerProcess = messages == 1 ? 0 : messages;
    options_.largestMessage = 1u << 20;
    options_.processes = 3;
    Pool pool(options_);
    // Those of a batch go together where a worker may have more than one.
    EXPECT_EQ(CallQueue(pool).window() > options_.processes, messages > 1);
    const auto take = [&](std::size_t length = 10, bool fresh = false,
                          Deadline until = Deadline::max()) {
      return std::get<Worker>(pool.take(length, fresh, until));
    };
    EXPECT_TRUE(std::holds_alternative<Wait>(pool.take(10, false, soon)));
    greet();
    const std::uint64_t expected = messages == 1 ? shortMessage : options_.largestMessage;
    {
      // Killed, since it is dropped before it is done.
      const Worker worker = take();
      EXPECT_EQ(next(), Told(ControlKind::fork, 0, expected));
    }
    EXPECT_EQ(next(), Told(ControlKind::kill, 0, 0));
    std::deque<FairSemaphore::Permit> permits;
    // Of those who hold permits one has its reply; what was needed is remembered.
    for (const auto& [held, forks] : {std::pair(1, each), {3, 2 * each - 2}, {0, 2}, {0, 0}}) {
      while (permits.size() < std::size_t(held)) permits.emplace_back(pool.permits(), false);
      if (held == 0) permits.clear();
      pool.tidy();
      EXPECT_EQ(forksTold(), forks) << held;
    }

    Optional<Worker> worker(take(expected));
    EXPECT_EQ(next(), nothing);
    const Worker fresh = take(10, true);
    EXPECT_EQ(next(), Told(ControlKind::fork, 3 * each + 1, expected));
    const Worker longer = take((1u << 20) + 1);
    EXPECT_EQ(next(), Told(ControlKind::fork, 3 * each + 2, (1u << 20) + 1));
    EXPECT_TRUE(pool.messagesLeft(*worker) == messages && !pool.isSpent(*worker));
    worker->nextSequence();
    EXPECT_TRUE(pool.messagesLeft(*worker) == messages - 1 &&
                pool.isSpent(*worker) == (messages == 1));
    pool.giveBack(std::move(*worker));
    // One has gone meanwhile: another takes its place, and another service follows.
    close(channels_.extract(2).mapped());
    EXPECT_EQ(take().served(), 0u);
    EXPECT_TRUE(std::holds_alternative<Wait>(pool.take(10, false, soon)));
    EXPECT_TRUE(greet());
    // One speaks up behind its answer: the next message has another worker, then another service.
    if (messages > 1) {
      Worker answered = take();
      EXPECT_EQ(std::get<ControlKind>(next()), ControlKind::fork);
      answered.nextSequence();
      EXPECT_EQ(write(channels_.at(last_.slot), "x", 1), 1);
      pool.giveBack(std::move(answered));
      EXPECT_EQ(take().served(), 0u);
      EXPECT_TRUE(std::holds_alternative<Wait>(pool.take(10, false, soon)));
      EXPECT_TRUE(greet());
    }
    // One speaks up without having been asked.
    EXPECT_EQ(take().served(), 0u);
    pool.tidy();
    while (next() != nothing) continue;
    EXPECT_EQ(write(channels_.at(1), "x", 1), 1);
    EXPECT_EQ(outcomeOf([&] { return take().served(); }), "protocolViolation");
    EXPECT_TRUE(std::holds_alternative<Wait>(pool.take(10, false, soon)));
    EXPECT_TRUE(greet());
    std::deque<Worker> all;
    EXPECT_THROW(for (;;) all.push_back(take(10, true)), std::bad_variant_access);
    EXPECT_GE(all.size(), 3 * options_.processes);
    EXPECT_EQ(outcomeOf([&] { return take(10, true, Deadline()).served(); }), "timedOut");
    EXPECT_EQ(all[0].service().state(), State::retired);
  }
}

}  // namespace
}  // namespace Keelgate::Host
