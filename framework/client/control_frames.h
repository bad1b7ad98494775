// SPDX-License-Identifier: Apache-2.0
/// Sending and receiving the frames of the control channel, without waiting longer than asked to.
///
/// Callable from any thread: a frame is one packet, so those of several threads don't mix.
#pragma once

#include "framework/client/deadline.h"
#include "framework/transport/frames.h"

namespace Keelgate {

/// For sendFrame: nothing goes along.
constexpr int noDescriptor = -1;

/// A frame of this protocol with all its numbers 0.
Transport::ControlFrame makeFrame(Transport::ControlKind kind, std::uint32_t slot) noexcept;

/// Sends the frame, with a copy of the descriptor. Whether it went; waits for room until the
/// deadline. The descriptor stays the caller's.
bool sendFrame(int control, const Transport::ControlFrame& frame, int descriptor,
               Deadline deadline) noexcept;

/// `nothing` has arrived yet, or nothing will any more.
enum class Received { frame, nothing, end };

/// The next frame, without waiting. One that is not exactly right is the end of the channel. A
/// descriptor that comes along is dropped by the kernel.
Received receiveFrame(int control, Transport::ControlFrame& frame) noexcept;

}  // namespace Keelgate
