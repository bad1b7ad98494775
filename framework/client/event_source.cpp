// SPDX-License-Identifier: Apache-2.0
#include "framework/client/event_source.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/timerfd.h>

#include <cerrno>

namespace Keelgate {

EventSource::EventSource(Pool& pool)
    : queue_(pool),
      epoll_(pool.registry(), epoll_create1(EPOLL_CLOEXEC)),
      timer_(pool.registry(), timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK)),
      wakeUp_(pool.registry(), eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  if (!epoll_ || !timer_ || !wakeUp_) {
    throw shortage("No descriptor to poll could be made", errno);
  }
  arm(timer_.get(), EPOLLIN);
  arm(wakeUp_.get(), EPOLLIN);
}

void EventSource::start(CallList calls) {
  queue_.push(std::move(calls));
  eventfd_write(wakeUp_.get(), 1);
}

void EventSource::dispatch() {
  const std::unique_lock lock(dispatching_, std::try_to_lock);
  if (!lock) return;
  eventfd_t ignored;
  eventfd_read(wakeUp_.get(), &ignored);
  // Also when a completion throws: what is left has to wake somebody.
  struct Rearm {
    EventSource& source;
    ~Rearm() { source.armAll(); }
  } const rearm{*this};
  queue_.run(false);
}

/// A descriptor that was closed has left the set by itself.
void EventSource::arm(int descriptor, std::uint32_t events) {
  if (descriptor < 0) return;
  epoll_event event{.events = events, .data = {.fd = descriptor}};
  if (epoll_ctl(epoll_.get(), EPOLL_CTL_MOD, descriptor, &event) != 0 && errno == ENOENT) {
    epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, descriptor, &event);
  }
}

void EventSource::armAll() {
  queue_.eachWait([this](const Wait& wait) {
    // Once: an idle worker's channel, or that of a service, is nobody's news.
    arm(wait.descriptor, static_cast<std::uint32_t>(wait.events) | EPOLLONESHOT);
  });
  const Deadline next = queue_.nextTime();
  itimerspec time{};
  if (next != Deadline::max()) {
    // The steady clock is the one that the timer counts by; a time of zero would disarm it.
    const auto since = std::max(next.time_since_epoch(), Deadline::duration(1));
    time.it_value = {.tv_sec = since.count() / 1'000'000'000,
                     .tv_nsec = since.count() % 1'000'000'000};
  }
  timerfd_settime(timer_.get(), TFD_TIMER_ABSTIME, &time, nullptr);
}

}  // namespace Keelgate
