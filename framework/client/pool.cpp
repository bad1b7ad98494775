// SPDX-License-Identifier: Apache-2.0
#include "framework/client/pool.h"

#include "framework/contracts/layers.h"
#include "framework/contracts/memory_budget.h"
#include "framework/transport/wire.h"

#include <unistd.h>

#include <algorithm>
#include <array>

namespace Keelgate {

using Reason = HostError::Reason;
using std::chrono::milliseconds;

namespace {

/// For the first start, when no message is waiting yet.
constexpr milliseconds firstStartPatience{10'000};

/// A start that a message waits for may take so long, even if the message's own time is up before:
/// where the limit is shorter than a start takes, no service would ever get ready. Ending one that
/// did not get ready comes on top, and the sum stays below a second.
constexpr milliseconds startPatience{500};

/// How long a service is given to end by itself.
constexpr milliseconds endPatience{100};

/// Workers that have answered may take a moment to end; beside them fit as many as are kept.
constexpr std::size_t slotsPerPlace = 4;

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
          .requireLayers = options.requireLayers,
          .messagesPerWorker = std::max<std::uint64_t>(options.messagesPerProcess, 1),
          .cpuSecondsPerWorker = cpuSeconds(options),
          .maximumWorkers = slotsPerPlace * processes};
}

}  // namespace

void BackOff::noteDeath() noexcept {
  constexpr std::array waits{milliseconds(0),    milliseconds(10),     milliseconds(100),
                             milliseconds(1000), milliseconds(10'000), milliseconds(60'000)};
  notBefore_ = Clock::now() + waits[std::min(deaths_, waits.size() - 1)];
  ++deaths_;
}

/// A call's place among those that may be in work.
class Pool::Place {
 public:
  Place(Pool& pool, Deadline deadline) : pool_(pool) {
    if (!pool.turnstile_.enter(deadline)) {
      throw HostError(Reason::timedOut, "no process came free in time");
    }
    const std::lock_guard lock(pool.mutex_);
    pool.mostBusy_ = std::max(pool.mostBusy_, ++pool.busy_);
  }
  ~Place() {
    {
      const std::lock_guard lock(pool_.mutex_);
      --pool_.busy_;
    }
    pool_.turnstile_.leave();
  }
  Place(const Place&) = delete;
  Place& operator=(const Place&) = delete;

 private:
  Pool& pool_;
};

Pool::Pool(const Client::Options& options, std::size_t processes)
    : owner_(getpid()),
      settings_(settingsFor(options, processes)),
      // The seal is for good, so a worker that is used again must be ready for the largest.
      foreseen_(options.messagesPerProcess > 1 ? options.largestMessage : shortMessage),
      log_(options.log),
      // Each worker's channel twice while it is forked, and the two ends of each service, of which
      // every call may hold an old one.
      book_(2 * settings_.maximumWorkers + 3 * (processes + 2)),
      turnstile_(processes) {
  {
    Lock lock(mutex_);
    running(lock, deadlineAfter(firstStartPatience));
  }
  forkAhead();
}

Pool::~Pool() {
  if (service_) service_->end(endPatience);
}

bool Pool::isOurs() const noexcept {
  return getpid() == owner_;
}

Pool::Report Pool::report(Deadline deadline) {
  Lock lock(mutex_);
  const Service service = running(lock, deadline);
  return {.version = service->version(), .layers = service->layers()};
}

void Pool::exchange(const ClientRequest& request, Deadline deadline, const Accept& accept) try {
  const Place place(*this, deadline);
  Worker worker = take(request.message.size(), deadline, false);
  const bool used = worker.served() > 0;
  Optional<HostError> failure =
      attempt(std::move(worker), request, deadline, accept, settings_.messagesPerWorker);
  // It may have been the doing of the messages before: this one gets a worker to itself. A message
  // that was alone with its worker has had its only try.
  if (failure && used && failure->reason != Reason::timedOut) {
    failure = attempt(take(request.message.size(), deadline, true), request, deadline, accept, 1);
  }
  if (failure) throw HostError(*failure);
} catch (const std::bad_alloc&) {
  throw HostError(Reason::resourcesExhausted, "this process has no memory for the reply");
}

Optional<HostError> Pool::attempt(Worker worker, const ClientRequest& request, Deadline deadline,
                                  const Accept& accept, std::uint64_t mayServe) {
  ReceivedReply reply;
  Optional<HostError> failure = worker.exchange(request, deadline, reply);
  const bool spent = failure || worker.served() >= mayServe;
  if (spent) forkAhead();
  for (const String& line : reply.log) logLine(log_, escapeLogLine(line));
  if (failure) return failure;
  try {
    accept(reply);
  } catch (const Transport::MalformedReply&) {
    return lie();
  } catch (const Transport::ReadLimitReached& reached) {
    if (reached.limit == Transport::ReadLimitReached::Limit::time) {
      return HostError(Reason::timedOut, "");
    }
    return HostError(Reason::resourcesExhausted, "");
  } catch (...) {
    keep(std::move(worker), spent);
    throw;
  }
  keep(std::move(worker), spent);
  // A reply can be made to take long to read, too.
  if (Clock::now() >= deadline) return HostError(Reason::timedOut, "");
  return std::nullopt;
}

void Pool::keep(Worker worker, bool spent) {
  const std::lock_guard lock(mutex_);
  backOff_.noteGoodReply();
  proved_ = true;
  if (spent) {
    worker.finish();
  } else if (worker.service() == service_.get() && service_->isUsable()) {
    idle_.push_back(std::move(worker));
  }
}

Worker Pool::take(std::size_t length, Deadline deadline, bool fresh) {
  Lock lock(mutex_);
  for (;;) {
    Service service = running(lock, deadline);
    if (!fresh && length <= foreseen_) {
      if (Optional<Worker> idle = takeIdle()) return std::move(*idle);
    }
    lock.unlock();
    try {
      auto forked = service->fork(std::max<std::uint64_t>(length, foreseen_), deadline);
      if (forked) return {service, std::move(*forked)};
      if (service->isUsable()) throw HostError(Reason::timedOut, "no process came free in time");
    } catch (const StartFailure& failure) {
      throw HostError(Reason::startFailed, failure.sentence);
    }
    service.reset();
    lock.lock();
  }
}

/// An idle worker that is still there. What was to be had from another has been waiting for no
/// message, so no message is lost with it.
Optional<Worker> Pool::takeIdle() {
  while (!idle_.empty()) {
    Worker worker = std::move(idle_.front());
    idle_.pop_front();
    const DataChannel::Look look = worker.look();
    if (look == DataChannel::Look::quiet) return worker;
    // One that speaks up after an answer was taken over by that message. One that has never had
    // any is no worker of ours, and so will be the next.
    if (look == DataChannel::Look::talking && worker.served() == 0) throw lie();
  }
  return std::nullopt;
}

Pool::Service Pool::running(Lock& lock, Deadline deadline) {
  for (;;) {
    if (service_ && service_->isUsable()) return service_;
    if (Clock::now() >= deadline) {
      if (!lastFailure_.empty()) throw HostError(Reason::startFailed, lastFailure_);
      throw HostError(Reason::timedOut, "the service was restarting");
    }
    if (starting_) {
      started_.wait_until(lock, deadline);
      continue;
    }
    if (service_ && service_->isLost() && !proved_) {
      backOff_.noteDeath();
      // Once for each service.
      proved_ = true;
      lastFailure_ = "The service ended before it had answered any message";
    }
    if (Clock::now() < backOff_.notBefore()) {
      awaitBackOff(lock, deadline);
    } else {
      start(lock, deadline);
    }
  }
}

void Pool::awaitBackOff(Lock& lock, Deadline deadline) {
  const Deadline next = backOff_.notBefore();
  if (next >= deadline) {
    const auto wait = std::chrono::ceil<std::chrono::seconds>(next - Clock::now());
    throw HostError(Reason::startFailed, lastFailure_ + "; it is not tried again for " +
                                             std::to_string(wait.count()) + " s");
  }
  started_.wait_until(lock, next);
}

void Pool::start(Lock& lock, Deadline deadline) {
  const Deadline ready = std::max(deadline, deadlineAfter(startPatience));
  // From here to where it is false again nothing may throw: everybody waits for this start.
  std::deque<Worker> oldWorkers;
  Optional<StartFailure> failure;
  starting_ = true;
  oldWorkers.swap(idle_);
  Service old = std::move(service_);
  lock.unlock();
  oldWorkers.clear();
  old.reset();
  Service fresh;
  bool failed = true;
  try {
    fresh = std::make_shared<ServiceProcess>(settings_, book_, ready);
    tellLayers(*fresh);
    failed = false;
  } catch (StartFailure& its) {
    failure.emplace(std::move(its));
  } catch (const std::bad_alloc&) {
    fresh.reset();
  }
  lock.lock();
  starting_ = false;
  proved_ = false;
  service_ = std::move(fresh);
  started_.notify_all();
  if (failed) backOff_.noteDeath();
  lastFailure_.clear();
  if (!failed) return;
  if (!failure) failure.emplace("There is no memory to start the service", true);
  lastFailure_ = failure->sentence;
  if (!failure->mayPass) throw HostError(Reason::startFailed, failure->sentence);
}

void Pool::tellLayers(const ServiceProcess& service) {
  const String missing = missingLayersLine(service.layers());
  if (std::exchange(layersTold_, true) || missing.empty()) return;
  try {
    logLine(log_, missing);
  } catch (...) {
    // The application's own sink, against what it was asked for. Nobody must wait for this start
    // for ever because of it.
  }
}

/// Has as many workers forked as the calls that come next will take. The place that the calling
/// thread holds, if any, counts as free: it has its reply.
void Pool::forkAhead() noexcept {
  const std::size_t each = settings_.messagesPerWorker == 1 ? 2 : 1;
  // These outlive the lock: whoever drops a service last waits for its end.
  Service service;
  Optional<Worker> worker;
  Lock lock(mutex_);
  service = service_;
  if (!service) return;
  service->collect();
  const std::size_t others = busy_ == 0 ? 0 : busy_ - 1;
  while (service == service_ && service->isUsable() &&
         idle_.size() + forking_ + others < each * mostBusy_) {
    ++forking_;
    lock.unlock();
    worker.reset();
    if (auto forked = forkQuietly(service)) worker.emplace(std::move(*forked));
    lock.lock();
    --forking_;
    if (!worker) return;
    try {
      if (service == service_) idle_.push_back(std::move(*worker));
    } catch (const std::bad_alloc&) {
      return;
    }
  }
}

/// Nobody waits for these workers: what goes wrong is met again by whoever needs one.
Optional<Worker> Pool::forkQuietly(const Service& service) const noexcept {
  try {
    if (auto forked = service->fork(foreseen_, deadlineAfter(killPatience))) {
      return Worker(service, std::move(*forked));
    }
  } catch (const std::exception&) {
  }
  return std::nullopt;
}

}  // namespace Keelgate
