// SPDX-License-Identifier: Apache-2.0
/// Points in time that calls end at, and the one way to wait for a descriptor.
///
/// Pure functions of the clock; callable from any thread. The clock is the steady one: who sets the
/// machine's time neither ends a call early nor keeps it waiting.
#pragma once

#include <chrono>

namespace Keelgate {

using Clock = std::chrono::steady_clock;
using Deadline = Clock::time_point;

/// The point in time that is so far away; a span that the clock cannot express is cut to a year.
Deadline deadlineAfter(std::chrono::milliseconds span) noexcept;

/// Waits until one of `events` (poll.h), a hang-up or an error is there; gives what is, or 0 when
/// the deadline has passed. Signals that the application handles do not end it.
short waitFor(int descriptor, short events, Deadline deadline) noexcept;

}  // namespace Keelgate
