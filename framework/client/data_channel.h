// SPDX-License-Identifier: Apache-2.0
/// The client's end of the channel to one worker: one request, then one reply.
///
/// The worker may be taken over from the moment that it has read the first byte. So it is never
/// trusted to read, to answer, to stop answering or to tell the truth about a length.
#pragma once

#include "framework/client/deadline.h"
#include "framework/client/descriptor.h"
#include "framework/protocol/data_frames.h"

#include <keelgate/values.h>

#include <sys/uio.h>

#include <array>
#include <cstddef>
#include <string_view>

namespace Keelgate {

/// A message on its way. Everything is borrowed for the time of the call. The lengths have been
/// checked against the client's limits.
struct ClientRequest {
  /// recordNumber<Record> of the record that is asked for.
  std::uint16_t record;
  UInt64 command;
  std::string_view service;
  Bytes message;
};

/// The bytes of a reply, not decoded.
struct ReceivedReply {
  Protocol::ReplyKind kind{};
  /// All that has arrived, headers and log lines too; the body is a part of it.
  Data buffer;
  Bytes body;
  /// Bytes that its record may take in memory.
  std::size_t memory = 0;
  /// As the worker sent them: not to be shown before escapeLogLine.
  Array<String> log;
};

/// How an exchange ended.
enum class Ending {
  answered,
  /// The worker's end is closed.
  died,
  /// The deadline has passed.
  late,
  /// The worker sent what is no answer, or sent it at the wrong time.
  violation,
};

/// The most bytes that the body of a reply may have: base + factor x the message's length.
///
/// The factor: the densest honest message is a list of empty payloads at a dozen bytes each, and
/// a record of 156 absent fields takes some 200 bytes; a value that is shared within a message
/// may grow 64-fold. The base: short messages may share values up to a MiB in all, and an error
/// repeats the service identifier and a path.
///
/// Without a bound a taken-over worker could have the client gather a reply until the machine's
/// memory is used up.
constexpr std::uint64_t replyBase = std::uint64_t{2} << 20;
constexpr std::uint64_t replyFactor = 128;

/// One thread at a time. After any Ending but `answered` the channel is of no more use.
class DataChannel {
 public:
  /// `heap`: how much the worker has, in bytes.
  DataChannel(Descriptor own, std::size_t heap) noexcept : channel_(std::move(own)), heap_(heap) {}

  /// What can be seen of the worker while nothing is asked of it.
  enum class Look { quiet, gone, talking };
  [[nodiscard]] Look look() const noexcept;

  /// `reply` is complete with Ending::answered; its log lines count in any case. Throws
  /// std::bad_alloc.
  Ending exchange(const ClientRequest& request, Deadline deadline, ReceivedReply& reply);

 private:
  /// Header, service identifier, message.
  using Pieces = std::array<iovec, 3>;

  Ending send(const ClientRequest& request, Deadline deadline) const;
  Ending waitToSend(Deadline deadline) const noexcept;
  Ending receive(std::uint64_t allowance, Deadline deadline, ReceivedReply& reply);
  Ending receiveMore(std::size_t needed, Deadline deadline, ReceivedReply& reply);

  Descriptor channel_;
  std::size_t heap_;
  /// Of the next request. A reply that repeats it cannot be one that was prepared for an earlier
  /// request.
  std::uint32_t sequence_ = 0;
  /// How far the reply's buffer is filled.
  std::size_t filled_ = 0;
};

}  // namespace Keelgate
