// SPDX-License-Identifier: Apache-2.0
/// The client's end of the channel to one worker: requests, and their replies in the same order.
///
/// The worker may be taken over from the moment that it has read the first byte. So it is never
/// trusted to read, to answer, to stop answering or to tell the truth about a length.
#pragma once

#include "framework/client/deadline.h"
#include "framework/protocol/data_frames.h"

#include <keelgate/values.h>

#include <cstddef>
#include <deque>
#include <memory>
#include <string_view>

namespace Keelgate {

/// A message on its way. Everything is borrowed until its call has ended. The lengths have been
/// checked against the client's limits.
struct OutgoingMessage {
  /// recordNumber<Record> of the record that is asked for.
  std::uint16_t record;
  UInt64 command;
  std::string_view service;
  Bytes message;
};

/// What can be seen of a worker that is not asked anything.
enum class WorkerSign { quiet, gone, talking };
WorkerSign signOf(int channel) noexcept;

/// Gives a block back: to the kernel where so many bytes were mapped, else to the C library.
struct FreeBlock {
  std::size_t mapped = 0;
  void operator()(std::byte* block) const noexcept;
};

/// What has arrived and was not dropped. It grows without being filled or, if it is large, copied.
class ReceiveBuffer {
 public:
  [[nodiscard]] Bytes bytes() const noexcept { return {block_.get() + begin_, end_ - begin_}; }
  /// Room behind them, of at least a byte more than they need to be `wanted` bytes: so that more
  /// than is wanted shows. At most doubled, but for whole pages, whatever is wanted. Throws
  /// std::bad_alloc.
  std::span<std::byte> room(std::size_t wanted);
  void add(std::size_t count) noexcept { end_ += count; }
  void drop(std::size_t count) noexcept;

 private:
  void grow(std::size_t size);

  std::unique_ptr<std::byte[], FreeBlock> block_;
  std::size_t size_ = 0;
  std::size_t begin_ = 0;
  std::size_t end_ = 0;
};

/// One thread at a time.
class Exchange {
 public:
  /// `channel` is borrowed. `sequence` is that of the first request: a reply that repeats its own
  /// cannot be one that was prepared for an earlier request. Throws std::bad_alloc.
  Exchange(int channel, std::uint32_t sequence) : channel_(channel), nextSequence_(sequence) {}
  Exchange(const Exchange&) = delete;
  Exchange& operator=(const Exchange&) = delete;

  /// Adds a request behind those that have no reply yet. Throws std::bad_alloc.
  void add(const OutgoingMessage& request);

  enum class State {
    /// To be advanced when the channel is writable, or readable.
    sending,
    /// The same when it is readable.
    receiving,
    /// The oldest request has its reply: to be dropped before it is advanced again.
    answered,
    /// The worker's end is closed.
    died,
    /// The worker sent what is not an answer, or sent it at the wrong time.
    violated,
  };
  /// Goes on without waiting, and for a bounded time, however much the worker takes or sends.
  /// Throws std::bad_alloc.
  State advance();
  /// While it is sending or receiving: what to wait for before it is advanced again.
  [[nodiscard]] Wait wait(Deadline until) const noexcept;

  /// With State::answered, of the oldest request.
  [[nodiscard]] Protocol::ReplyKind kind() const noexcept { return parser_->kind(); }
  [[nodiscard]] Bytes body() const { return parser_->body(buffer_.bytes()); }
  /// Whether the worker ends with it.
  [[nodiscard]] bool isLast() const noexcept { return parser_->isLast(); }
  /// As the worker sent them so far: not to be shown before escapeLogLine.
  [[nodiscard]] const Array<String>& log() const noexcept { return parser_->log(); }
  /// Is done with that request.
  void drop() noexcept;

 private:
  struct Pending {
    Protocol::RequestHeader header;
    OutgoingMessage request;
  };

  [[nodiscard]] bool hasUnsent() const noexcept { return sent_ < pending_.size(); }
  void send();
  State receive();
  State parse();

  int channel_;
  std::uint32_t nextSequence_;
  std::deque<Pending> pending_;
  /// How many of these have been sent whole, and how many bytes of the next.
  std::size_t sent_ = 0;
  std::size_t sentBytes_ = 0;
  /// Nothing can be sent any more; there may be something to be read.
  bool isDeaf_ = false;
  /// Of the oldest.
  Optional<Protocol::ReplyParser> parser_;
  ReceiveBuffer buffer_;
  State state_ = State::sending;
};

}  // namespace Keelgate
