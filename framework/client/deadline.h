// SPDX-License-Identifier: Apache-2.0
/// Points in time that calls end at, and the one way to wait for a descriptor.
///
/// Pure functions of the clock; callable from any thread. The clock is the steady one: who sets the
/// machine's time neither ends a call early nor keeps it waiting.
#pragma once

#include <poll.h>

#include <chrono>
#include <cstddef>

namespace Keelgate {

using Clock = std::chrono::steady_clock;
using Deadline = Clock::time_point;

/// The point in time that is so far away; a span that the clock cannot express is cut to a year.
Deadline deadlineAfter(std::chrono::milliseconds span) noexcept;

/// What a state machine waits for before its next step: one of `events` (poll.h), a hang-up or an
/// error on the descriptor, or the point in time. It may be asked to go on earlier.
struct Wait {
  /// Below 0: only the time counts.
  int descriptor = -1;
  short events = 0;
  Deadline until{};
};

/// As poll, until a point in time; Deadline::max() stands for no end.
int pollUntil(pollfd* entries, std::size_t count, Deadline until) noexcept;

/// Waits for it; gives what is there, or 0 when the time has come. Signals that the application
/// handles do not end it.
short waitFor(const Wait& wait) noexcept;

}  // namespace Keelgate
