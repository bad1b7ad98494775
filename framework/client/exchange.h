// SPDX-License-Identifier: Apache-2.0
/// The client's end of the channel to one worker: one request, then one reply.
///
/// The worker may be taken over from the moment that it has read the first byte. So it is never
/// trusted to read, to answer, to stop answering or to tell the truth about a length.
#pragma once

#include "framework/client/deadline.h"
#include "framework/protocol/data_frames.h"

#include <keelgate/values.h>

#include <sys/uio.h>

#include <array>
#include <cstddef>
#include <string_view>

namespace Keelgate {

/// A message on its way. Everything is borrowed until its call has ended. The lengths have been
/// checked against the client's limits.
struct ClientRequest {
  /// recordNumber<Record> of the record that is asked for.
  std::uint16_t record;
  UInt64 command;
  std::string_view service;
  Bytes message;
};

/// What can be seen of a worker that is not asked anything.
enum class WorkerSign { quiet, gone, talking };
WorkerSign signOf(int channel) noexcept;

/// One thread at a time. It stays where it is: the kernel is given addresses inside of it.
class Exchange {
 public:
  /// `channel` is borrowed. `sequence` counts the requests of the worker from 0: a reply that
  /// repeats it cannot be one that was prepared for an earlier request.
  Exchange(int channel, const ClientRequest& request, std::uint32_t sequence) noexcept;
  Exchange(const Exchange&) = delete;
  Exchange& operator=(const Exchange&) = delete;

  enum class State {
    /// To be advanced when the channel is writable, or readable.
    sending,
    /// The same when it is readable.
    receiving,
    answered,
    /// The worker's end is closed.
    died,
    /// The worker sent what is not an answer, or sent it at the wrong time.
    violated,
  };
  /// Goes on without waiting, and for a bounded time, however much the worker takes or sends.
  /// Throws std::bad_alloc.
  State advance();
  [[nodiscard]] State state() const noexcept { return state_; }

  /// With State::answered.
  [[nodiscard]] Protocol::ReplyKind kind() const noexcept { return parser_.kind(); }
  [[nodiscard]] Bytes body() const { return parser_.body(received()); }
  /// Whether the worker ends with it.
  [[nodiscard]] bool isLast() const noexcept { return parser_.isLast(); }
  /// As the worker sent them so far: not to be shown before escapeLogLine.
  [[nodiscard]] const Array<String>& log() const noexcept { return parser_.log(); }

 private:
  State send();
  State receive();
  [[nodiscard]] Bytes received() const { return Bytes(buffer_).first(filled_); }

  int channel_;
  Protocol::RequestHeader header_;
  /// What is left to send of header, service identifier and message.
  std::array<iovec, 3> pieces_;
  Protocol::ReplyParser parser_;
  /// All that has arrived, headers and log lines too.
  Data buffer_;
  std::size_t filled_ = 0;
  State state_ = State::sending;
};

}  // namespace Keelgate
