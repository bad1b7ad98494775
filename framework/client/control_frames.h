// SPDX-License-Identifier: Apache-2.0
/// Sending and receiving the frames of the control channel, without waiting longer than asked to.
#pragma once

#include "framework/client/deadline.h"
#include "framework/transport/frames.h"

namespace Keelgate {

constexpr int noDescriptor = -1;

Transport::ControlFrame makeFrame(Transport::ControlKind kind, std::uint32_t slot) noexcept;

/// Sends the frame, with a copy of the descriptor. Whether it went; waits for room until the
/// deadline.
bool sendFrame(int control, const Transport::ControlFrame& frame, int descriptor,
               Deadline deadline) noexcept;

enum class Received { frame, nothing, end };

/// The next frame, without waiting. One that is not exactly right is the end of the channel. A
/// descriptor that comes along is dropped by the kernel.
Received receiveFrame(int control, Transport::ControlFrame& frame) noexcept;

}  // namespace Keelgate
