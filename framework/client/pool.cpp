// SPDX-License-Identifier: Apache-2.0
#include "framework/client/pool.h"

#include "framework/contracts/memory_budget.h"

#include <poll.h>

#include <thread>

namespace Keelgate {

using Reason = HostError::Reason;
using std::chrono::milliseconds;

namespace {

/// Workers that have answered may take a moment to end, and their ends are told together; beside
/// them fit as many as are kept.
constexpr std::size_t slotsPerProcess = 6;

/// A quarter of the processes, one at least, is kept free for small messages; a single one is for
/// all.
constexpr std::size_t largePermits(std::size_t processes) {
  return processes == 1 ? 1 : processes - (processes + 3) / 4;
}

/// So many abnormal ends at once are not held up.
constexpr int abnormalBurst = 4;

std::uint64_t cpuSeconds(const Client::Options& options) {
  // Stands behind the deadline, so it is rounded up generously; a worker's messages add up.
  constexpr std::int64_t day = 86'400;
  const auto limit = std::chrono::ceil<std::chrono::seconds>(options.timeLimit).count();
  const auto messages =
      static_cast<std::int64_t>(std::min<std::size_t>(options.messagesPerProcess, day));
  return static_cast<std::uint64_t>((std::clamp<std::int64_t>(limit, 0, day) + 1) *
                                    std::max<std::int64_t>(messages, 1));
}

ServiceSettings settingsFor(const Client::Options& options, std::size_t processes) {
  return {.path = options.servicePath,
          .socket = options.socket,
          .socketUser = options.socketUser,
          .requireLayers = options.requireLayers,
          .forks = options.isolation == Client::Isolation::fork,
          .messagesPerWorker = std::max<std::uint64_t>(options.messagesPerProcess, 1),
          .cpuSecondsPerWorker = cpuSeconds(options),
          .maximumWorkers = slotsPerProcess * processes};
}

}  // namespace

std::size_t processesFor(const Client::Options& options) {
  const std::size_t wanted =
      options.processes == 0 ? std::thread::hardware_concurrency() : options.processes;
  return std::clamp<std::size_t>(wanted, 1, Client::Options::maximumProcesses);
}

void RecentPeak::note(std::size_t now, Deadline at) noexcept {
  constexpr std::chrono::seconds window(2);
  if (at >= since_ + window) {
    before_ = at >= since_ + 2 * window ? 1 : here_;
    here_ = 1;
    since_ = at;
  }
  here_ = std::max(here_, now);
}

Deadline AbnormalEnds::note(Deadline now) noexcept {
  if (perSecond_ == 0) return now;
  const milliseconds interval(1000 / perSecond_);
  // Not ahead by more than a message may take: those who come after an attack do not pay for it.
  constexpr milliseconds furthest(5000);
  next_ = std::clamp(next_ + interval, now - (abnormalBurst - 1) * interval, now + furthest);
  return std::max(next_, now);
}

Pool::Pool(const Client::Options& options)
    : processes_(processesFor(options)),
      settings_(settingsFor(options, processes_)),
      // The seal is for good, so a worker that is used again must be ready for the largest.
      expectedLength_(options.messagesPerProcess > 1 ? options.largestMessage : shortMessage),
      log_(options.log),
      // Each worker's channel twice while it is forked, the two ends of each service, of which
      // every call may hold an old one, and what a call waits on.
      registry_(2 * settings_.maximumWorkers + 5 * (processes_ + 4)),
      permits_(processes_, largePermits(processes_), registry_),
      supervisor_(settings_, log_, registry_),
      abnormalEnds_(options.abnormalEndsPerSecond) {}

bool Pool::isLarge(std::size_t length) const noexcept {
  constexpr std::size_t large = std::size_t{4} << 20;
  return length >= large;
}

Supervisor::Service Pool::start(Deadline deadline) {
  for (;;) {
    auto running = supervisor_.demand(deadline);
    if (const Wait* wait = std::get_if<Wait>(&running)) {
      waitFor(*wait);
      continue;
    }
    tidy();
    return std::get<Supervisor::Service>(std::move(running));
  }
}

std::variant<Worker, Wait> Pool::take(std::size_t length, bool fresh, Deadline deadline) {
  auto running = supervisor_.demand(deadline);
  if (const Wait* wait = std::get_if<Wait>(&running)) return *wait;
  const auto& service = std::get<Supervisor::Service>(running);
  if (!fresh && length <= expectedLength_) {
    if (Optional<Worker> idle = takeIdle(service)) return std::move(*idle);
  }
  if (auto forked = service->fork(std::max<std::uint64_t>(length, expectedLength_))) {
    return Worker(service, std::move(*forked));
  }
  service->readNews();
  if (Clock::now() >= deadline) {
    // A zygote that frees no worker for so long serves nobody else either.
    service->retire();
    throw HostError(Reason::timedOut, "no process came free in time");
  }
  return service->waitForNews(deadline);
}

/// An idle worker that is still there. What was to be had from another has been waiting for no
/// message, so no message is lost with it.
Optional<Worker> Pool::takeIdle(const Supervisor::Service& service) {
  const std::lock_guard lock(mutex_);
  while (!idle_.empty()) {
    Worker worker = std::move(idle_.front());
    idle_.pop_front();
    if (&worker.service() != service.get()) continue;
    const WorkerSign sign = worker.sign();
    if (sign == WorkerSign::quiet) return worker;
    // One that speaks up after an answer was taken over by that message. One that has never had
    // any is not a worker of ours, and neither will the next be.
    service->retire();
    if (sign == WorkerSign::talking && worker.served() == 0) {
      throw HostError(Reason::protocolViolation, "");
    }
  }
  return std::nullopt;
}

void Pool::giveBack(Worker worker) noexcept {
  const std::lock_guard lock(mutex_);
  // Of those that messages had to themselves, one after the other, there may be more than are used
  // again: they would hold all slots.
  if (isSpent(worker) || idle_.size() >= processes_) {
    worker.finish();
  } else {
    keepIdle(std::move(worker));
  }
}

void Pool::tidy() noexcept {
  const Supervisor::Service service = supervisor_.current();
  for (std::size_t rest = service ? startForking(*service) : 0; rest > 0; --rest) {
    forkAhead(service);
  }
  supervisor_.tidy();
}

/// How many workers to fork for the calls that come next. The permit that the calling thread holds,
/// if any, counts as free: it has its reply.
std::size_t Pool::startForking(const ServiceProcess& service) noexcept {
  const std::size_t each = settings_.messagesPerWorker == 1 ? 2 : 1;
  const std::lock_guard lock(mutex_);
  const std::size_t held = permits_.held();
  busy_.note(held, Clock::now());
  const std::size_t wanted = each * busy_.value();
  // Those of a service that was replaced were kept before those of its successor.
  while (!idle_.empty() && &idle_.front().service() != &service) idle_.pop_front();
  while (idle_.size() > wanted) idle_.pop_back();
  const std::size_t there = idle_.size() + forking_ + (held == 0 ? 0 : held - 1);
  const std::size_t missing = wanted > there ? wanted - there : 0;
  forking_ += missing;
  return missing;
}

/// Nobody waits for this worker: what goes wrong is met again by whoever needs one.
void Pool::forkAhead(const Supervisor::Service& service) noexcept {
  Optional<ServiceProcess::Forked> forked;
  try {
    forked = service->fork(expectedLength_);
  } catch (const std::exception&) {
  }
  const std::lock_guard lock(mutex_);
  --forking_;
  if (!forked) return;
  Worker worker(service, std::move(*forked));
  keepIdle(std::move(worker));
}

/// With the lock.
void Pool::keepIdle(Worker worker) noexcept try {
  if (supervisor_.isCurrent(&worker.service())) idle_.push_back(std::move(worker));
} catch (const std::bad_alloc&) {
  // There will be another one.
}

Deadline Pool::noteAbnormalEnd() noexcept {
  const std::lock_guard lock(mutex_);
  return abnormalEnds_.note(Clock::now());
}

}  // namespace Keelgate
