// SPDX-License-Identifier: Apache-2.0
#include "framework/client/deadline.h"

#include <poll.h>

#include <algorithm>
#include <cerrno>
#include <ctime>

namespace Keelgate {

using std::chrono::milliseconds;
using std::chrono::nanoseconds;

Deadline deadlineAfter(milliseconds span) noexcept {
  constexpr milliseconds year = std::chrono::hours(24 * 365);
  return Clock::now() + std::clamp(span, milliseconds(0), year);
}

int pollUntil(pollfd* entries, std::size_t count, Deadline until) noexcept {
  const nanoseconds left = std::max(nanoseconds(0), nanoseconds(until - Clock::now()));
  const timespec timeout{.tv_sec = left.count() / 1'000'000'000,
                         .tv_nsec = left.count() % 1'000'000'000};
  // Nanoseconds: poll's milliseconds would end a wait early or late by up to one of them.
  return ppoll(entries, count, until == Deadline::max() ? nullptr : &timeout, nullptr);
}

short waitFor(const Wait& wait) noexcept {
  // The kernel ignores an entry whose descriptor is negative.
  pollfd entry{.fd = wait.descriptor, .events = wait.events, .revents = 0};
  for (;;) {
    const int ready = pollUntil(&entry, 1, wait.until);
    if (ready > 0) return entry.revents;
    if (ready == 0) return 0;
    // An error other than an interruption is as good as a dead peer to the caller, who finds out
    // which with the next read or write.
    if (errno != EINTR) return POLLERR;
  }
}

}  // namespace Keelgate
