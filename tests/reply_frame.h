// SPDX-License-Identifier: Apache-2.0
/// What a worker sends, in one piece.
#pragma once

#include "framework/protocol/data_frames.h"

namespace Keelgate::Testing {

/// Adds a frame of a reply to others.
inline void appendReplyFrame(Data& frames, std::uint32_t sequence, Protocol::ReplyKind kind,
                             Bytes body, bool last = false) {
  const auto header = Protocol::makeReplyHeader(sequence, kind, body.size(), last);
  const Bytes headerBytes = std::as_bytes(std::span(&header, 1));
  frames.insert(frames.end(), headerBytes.begin(), headerBytes.end());
  frames.insert(frames.end(), body.begin(), body.end());
}

}  // namespace Keelgate::Testing
