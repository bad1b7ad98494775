// SPDX-License-Identifier: Apache-2.0
/// The data channel, for both of its ends: requests and replies are made, and taken apart, here.
///
/// One thread at a time for each channel and object.
#pragma once

#include "framework/protocol/frames.h"

#include <keelgate/values.h>

#include <span>

namespace Keelgate::Protocol {

// ---------------------------------------------------------------------------------- the worker

/// Whether a request may be answered: it has this sequence number, and its lengths are within
/// `maximumServiceLength` and `longestMessage` bytes.
bool isExpected(const RequestHeader& header, std::uint32_t sequence,
                std::uint64_t longestMessage) noexcept;

/// The header of a frame with such a body. `last`: the worker ends after this reply.
ReplyHeader makeReplyHeader(std::uint32_t sequence, ReplyKind kind, std::uint64_t bodyLength,
                            bool last = false) noexcept;

/// Fills `bytes`. False at the end of the channel; an error is an end too, because a process with
/// three system calls has nothing to do about it.
bool readAll(int channel, std::span<std::byte> bytes) noexcept;

/// False when the other side has gone.
bool writeAll(int channel, Bytes bytes) noexcept;

// ---------------------------------------------------------------------------------- the client

/// `serviceLength` and `bodyLength` in bytes, within the limits.
RequestHeader makeRequestHeader(std::uint16_t record, std::uint64_t command,
                                std::size_t serviceLength, std::uint64_t bodyLength,
                                std::uint32_t sequence) noexcept;

/// Takes one reply apart while its bytes arrive. It keeps none of them but log lines, and nothing
/// that it says makes its user set aside more than has arrived.
class ReplyParser {
 public:
  /// A reply to the request `sequence`, whose body has at most `largestBody` bytes.
  ReplyParser(std::uint32_t sequence, std::uint64_t largestBody) noexcept
      : sequence_(sequence), largestBody_(largestBody) {}

  enum class State {
    /// The reply goes on to needed() bytes at least.
    incomplete,
    /// The bytes are exactly one reply.
    complete,
    /// No honest worker sends them.
    malformed,
  };
  /// `received`: all bytes of the reply so far, from its first one on. To be called again, with
  /// more of them, as long as it says `incomplete`. Throws std::bad_alloc.
  State parse(Bytes received);

  [[nodiscard]] std::size_t needed() const noexcept { return needed_; }

  /// Of a complete reply: what it is, and where among the bytes its body lies.
  [[nodiscard]] ReplyKind kind() const noexcept { return kind_; }
  /// Whether its worker ends with it.
  [[nodiscard]] bool isLast() const noexcept { return last_; }
  [[nodiscard]] Bytes body(Bytes received) const { return received.subspan(offset_, length_); }
  /// The log lines so far, as the worker sent them: any bytes at all.
  [[nodiscard]] const Array<String>& log() const noexcept { return log_; }

 private:
  [[nodiscard]] bool isExpected(const ReplyHeader& header) const noexcept;

  std::uint32_t sequence_;
  std::uint64_t largestBody_;
  std::size_t next_ = 0;
  std::size_t needed_ = sizeof(ReplyHeader);
  ReplyKind kind_{};
  bool last_ = false;
  std::size_t offset_ = 0;
  std::size_t length_ = 0;
  Array<String> log_;
};

}  // namespace Keelgate::Protocol
