// SPDX-License-Identifier: Apache-2.0
#include "framework/client/supervisor.h"

#include "framework/contracts/layers.h"

#include <poll.h>

#include <algorithm>
#include <array>

namespace Keelgate {

using Reason = HostError::Reason;
using ServiceState = ServiceProcess::State;
using std::chrono::milliseconds;

namespace {

/// For the client's own end, which has promised to be quick.
constexpr ServiceProcess::Patience little{.asked = milliseconds(70), .killed = milliseconds(20)};

/// For the thread that spawns a service; it does not tell the others when it has.
constexpr milliseconds spawnInterval{4};

/// A standby that could not be started is tried again so much later.
constexpr milliseconds standbyPatience{1000};

/// A client that has had so many replies is more than a single call.
constexpr std::uint64_t repliesBeforeStandby = 2;

}  // namespace

void BackOff::noteDeath() noexcept {
  constexpr std::array waits{milliseconds(0),    milliseconds(10),     milliseconds(100),
                             milliseconds(1000), milliseconds(10'000), milliseconds(60'000)};
  notBefore_ = Clock::now() + waits[std::min(deaths_, waits.size() - 1)];
  ++deaths_;
}

Supervisor::Supervisor(ServiceSettings settings, LogSink log, DescriptorRegistry& registry)
    : settings_(std::move(settings)), log_(std::move(log)), registry_(registry) {}

Supervisor::~Supervisor() {
  for (Service* service : {&current_, &standby_}) {
    if (*service) replaced_.push_back(std::move(*service));
  }
  // All at once: each takes its step before anybody is waited for.
  while (!replaced_.empty()) {
    std::erase_if(replaced_, [](const Service& service) { return service->end(little); });
    if (!replaced_.empty()) waitFor(replaced_.front()->nextStep());
  }
}

std::variant<Supervisor::Service, Wait> Supervisor::demand(Deadline deadline) {
  {
    const std::lock_guard lock(mutex_);
    if (state_ != State::running || current_->state() != ServiceState::running) settle();
    const Deadline now = Clock::now();
    switch (state_) {
      case State::running:
        return current_;
      case State::starting:
        if (now >= deadline) giveUp(deadline);
        return current_ ? current_->waitForNews(deadline)
                        : Wait{.until = std::min(deadline, now + spawnInterval)};
      case State::backingOff:
        if (backOff_.notBefore() >= deadline || !lastFailure_->mayPass) giveUp(deadline);
        return Wait{.until = backOff_.notBefore()};
      case State::stopped:
        if (now >= deadline) giveUp(deadline);
        state_ = State::starting;
    }
  }
  start(current_);
  return Wait{};
}

void Supervisor::giveUp(Deadline deadline) const {
  if (!lastFailure_) throw HostError(Reason::timedOut, "the service was restarting");
  const auto wait = backOff_.notBefore() - Clock::now();
  String sentence = lastFailure_->description;
  if (lastFailure_->mayPass && backOff_.notBefore() >= deadline && wait.count() > 0) {
    sentence += "; it is not tried again for " +
                std::to_string(std::chrono::ceil<std::chrono::seconds>(wait).count()) + " s";
  }
  throw HostError(Reason::startFailed, std::move(sentence));
}

/// The current one or the standby. Without the lock: to spawn a process takes its time.
void Supervisor::start(Service& which) {
  Service fresh;
  Optional<StartFailure> failure;
  try {
    fresh = std::make_shared<ServiceProcess>(settings_, registry_);
  } catch (StartFailure& its) {
    failure.emplace(std::move(its));
  } catch (const std::bad_alloc&) {
    failure.emplace("There is no memory to start the service", true);
  }
  const std::lock_guard lock(mutex_);
  which = std::move(fresh);
  if (&which == &standby_) {
    // Whoever needs one finds out what is wrong.
    noStandbyBefore_ = failure ? Clock::now() + standbyPatience : Deadline();
  } else if (failure) {
    fail(std::move(*failure));
  }
}

void Supervisor::fail(StartFailure failure) {
  backOff_.noteDeath();
  state_ = State::backingOff;
  lastFailure_ = std::move(failure);
}

/// Takes note of what has happened to the services.
void Supervisor::settle() {
  if (current_) current_->readNews();
  if (standby_) standby_->readNews();
  if (standby_ && standby_->state() == ServiceState::lost) {
    noStandbyBefore_ = Clock::now() + standbyPatience;
    replaced_.push_back(std::move(standby_));
  }
  if (state_ == State::backingOff && Clock::now() >= backOff_.notBefore()) state_ = State::stopped;
  if (current_ && current_->state() >= ServiceState::retired) replaceCurrent();
  if (state_ == State::stopped && standby_) {
    current_ = std::move(standby_);
    state_ = State::starting;
  }
  if (state_ == State::starting && current_ && current_->state() == ServiceState::running) {
    state_ = State::running;
    lastFailure_.reset();
    tellLayers();
  }
}

void Supervisor::replaceCurrent() {
  const Optional<StartFailure> failure = current_->startFailure();
  const bool died = current_->state() == ServiceState::lost && current_->replies() == 0;
  replaced_.push_back(std::move(current_));
  current_.reset();
  state_ = State::stopped;
  wantsStandby_ = true;
  if (failure) {
    fail(*failure);
  } else if (died) {
    fail({"The service ended before it had answered any message", true});
  }
}

void Supervisor::tellLayers() {
  const String missing = missingLayersLine(current_->layers());
  if (std::exchange(layersTold_, true) || missing.empty()) return;
  try {
    // With a name in front, so that it is not taken for a line of the service.
    logLine(log_, "keelgate: " + missing);
  } catch (...) {
    // The application's own sink, against what it was asked for. It must not cost a start.
  }
}

Supervisor::Service Supervisor::current() const {
  const std::lock_guard lock(mutex_);
  return state_ == State::running && current_->state() == ServiceState::running ? current_
                                                                                : nullptr;
}

void Supervisor::noteReply(ServiceProcess& service) noexcept {
  const std::uint64_t replies = service.noteReply();
  const std::lock_guard lock(mutex_);
  backOff_.noteGoodReply();
  if (replies >= repliesBeforeStandby) wantsStandby_ = true;
  const bool worn =
      replies >= repliesPerLayout || Clock::now() >= service.startedAt() + timePerLayout;
  if (!worn || !standby_) return;
  standby_->readNews();
  if (standby_->state() == ServiceState::running) service.retire();
}

void Supervisor::tidy() noexcept try {
  bool isMissing = false;
  {
    const std::lock_guard lock(mutex_);
    if (current_) current_->readNews();
    if (current_ && current_->state() != ServiceState::running) settle();
    std::erase_if(replaced_, [](const Service& service) {
      return service.use_count() == 1 && service->end({});
    });
    // By whoever made the last one unusable, and not by whoever needs the next one.
    isMissing = wantsStandby_ && state_ == State::stopped;
    if (isMissing) state_ = State::starting;
  }
  if (isMissing) start(current_);
  startStandby();
} catch (const std::exception&) {
  // A start that failed for good is met again by whoever asks for a service.
}

void Supervisor::startStandby() {
  {
    const std::lock_guard lock(mutex_);
    if (!current_ || standby_ || !wantsStandby_ || Clock::now() < noStandbyBefore_) return;
    noStandbyBefore_ = Deadline::max();
  }
  start(standby_);
}

}  // namespace Keelgate
