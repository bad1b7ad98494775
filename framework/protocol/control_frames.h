// SPDX-License-Identifier: Apache-2.0
/// The control channel, for both of its ends: each frame is one packet, sent and received whole.
///
/// Callable from any thread: the packets of several threads don't mix. Descriptors that are given
/// stay the caller's.
#pragma once

#include "framework/protocol/frames.h"

#include <string>

namespace Keelgate::Protocol {

/// Where a descriptor may go along: none does.
constexpr int noDescriptor = -1;

/// A frame of this protocol.
ControlFrame makeControlFrame(ControlKind kind, std::uint32_t slot = 0,
                              std::array<std::uint64_t, 4> numbers = {}) noexcept;

/// How a call on a channel ended. `wouldBlock`: nothing could be done now, which a call that may
/// wait never says; `malformed`: what came is not a frame of this protocol.
enum class Transfer { complete, wouldBlock, ended, malformed };

enum class Waiting { no, yes };

/// Sends the frame, with a copy of the descriptor if there is one.
Transfer sendControl(int channel, const ControlFrame& frame, int descriptor,
                     Waiting waiting) noexcept;

/// The client's end: takes the next frame. One that brings a descriptor is malformed.
Transfer receiveControl(int channel, ControlFrame& frame, Waiting waiting) noexcept;

/// The zygote's end: the same, and the descriptor that came along or noDescriptor. A fork brings
/// one and nothing else does; anything else is malformed. The descriptor is the caller's to close.
Transfer receiveControl(int channel, ControlFrame& frame, int& descriptor,
                        Waiting waiting) noexcept;

/// Of this build, as a ready frame carries it: 16 bits each for major, minor and patch.
std::uint64_t ownVersion() noexcept;
/// "1.2.3" from such a number.
std::string versionText(std::uint64_t version);

}  // namespace Keelgate::Protocol
