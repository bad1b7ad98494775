// SPDX-License-Identifier: Apache-2.0
/// The two channels as the service reads and writes them: frames in, frames out, nothing else.
///
/// Blocking; for single-threaded processes. Descriptor 3 is the channel in every one of them.
#pragma once

#include "framework/transport/frames.h"

#include <keelgate/values.h>
#include <cstddef>
#include <span>

namespace Keelgate {

/// A control frame, and the descriptor that came with it: the receiver's to close, or -1.
struct ReceivedControl {
  Transport::ControlFrame frame;
  int descriptor;
};

/// The next control frame, or nothing when the client has gone. Throws Sandbox::Refusal for a
/// packet that is no frame of this protocol. Of `kind` it checks only that a fork brings a
/// descriptor and nothing else does.
Optional<ReceivedControl> receiveControl();

/// Sends a frame; the magic number and version are filled in. A client that has gone is no error:
/// the next receive tells.
void sendControl(Transport::ControlFrame frame);

/// Sends a last frame. The caller exits then.
void endControl(const Transport::ControlFrame& last);

/// Fills `bytes` from the data channel. False at its end. An error is an end too: a process with
/// three system calls has nothing to do about it.
bool receiveAll(std::span<std::byte> bytes);

/// Writes all of `bytes` to the data channel. False when the client has gone.
bool sendAll(Bytes bytes);

}  // namespace Keelgate
