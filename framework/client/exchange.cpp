// SPDX-License-Identifier: Apache-2.0
#include "framework/client/exchange.h"

#include "framework/contracts/memory_budget.h"

#include <sys/socket.h>

#include <algorithm>
#include <cerrno>

namespace Keelgate {

namespace {

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

/// Most replies fit; room grows twofold from here with the bytes that have arrived.
constexpr std::size_t firstBuffer = 4096;

/// How often one step may go to the kernel: other messages and the deadline have their turn.
constexpr int callsPerStep = 16;

/// An interruption is the same: whoever waits for the channel goes on at once.
bool wouldBlock() noexcept {
  return errno == EAGAIN || errno == EINTR;
}

/// Takes `sent` bytes off the front. Gives whether any are left.
bool dropFront(std::array<iovec, 3>& pieces, std::size_t sent) noexcept {
  std::size_t left = 0;
  for (iovec& piece : pieces) {
    const std::size_t taken = std::min(sent, piece.iov_len);
    piece.iov_base = static_cast<char*>(piece.iov_base) + taken;
    piece.iov_len -= taken;
    sent -= taken;
    left += piece.iov_len;
  }
  return left > 0;
}

iovec pieceOf(const void* from, std::size_t size) noexcept {
  // sendmsg only reads through this pointer.
  return {.iov_base = const_cast<void*>(from), .iov_len = size};
}

std::uint64_t largestReply(const ClientRequest& request) {
  // 64 bits hold it for the largest message that there is. A worker has the body twice at the end,
  // by itself and framed.
  return std::min<std::uint64_t>(
      replyBase + request.service.size() + replyFactor * request.message.size(),
      memoryBudget(request.message.size()) / 2);
}

}  // namespace

WorkerSign signOf(int channel) noexcept {
  char byte;
  const ssize_t n = recv(channel, &byte, 1, MSG_PEEK | MSG_DONTWAIT);
  if (n > 0) return WorkerSign::talking;
  return n < 0 && wouldBlock() ? WorkerSign::quiet : WorkerSign::gone;
}

Exchange::Exchange(int channel, const ClientRequest& request, std::uint32_t sequence) noexcept
    : channel_(channel),
      header_(Protocol::makeRequestHeader(request.record, request.command, request.service.size(),
                                          request.message.size(), sequence)),
      // Three pieces and one call: the message, which may be large, is copied by the kernel alone.
      pieces_{pieceOf(&header_, sizeof header_),
              pieceOf(request.service.data(), request.service.size()),
              pieceOf(request.message.data(), request.message.size())},
      parser_(sequence, largestReply(request)) {}

Exchange::State Exchange::advance() {
  return state_ = state_ == State::sending ? send() : receive();
}

Exchange::State Exchange::send() {
  msghdr packet{};
  packet.msg_iov = pieces_.data();
  packet.msg_iovlen = pieces_.size();
  for (int i = 0; i < callsPerStep; ++i) {
    const ssize_t n = sendmsg(channel_, &packet, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (n >= 0 && !dropFront(pieces_, static_cast<std::size_t>(n))) return State::receiving;
    if (n >= 0) continue;
    if (!wouldBlock()) return State::died;
    // A worker that answers before it has the whole request, and then reads no more, would never
    // make room: so both directions are watched.
    switch (signOf(channel_)) {
      case WorkerSign::talking:
        return State::violated;
      case WorkerSign::gone:
        return State::died;
      case WorkerSign::quiet:
        return State::sending;
    }
  }
  return State::sending;
}

Exchange::State Exchange::receive() {
  if (buffer_.empty()) buffer_.resize(firstBuffer);
  for (int i = 0; i < callsPerStep; ++i) {
    // It grows when it is full of bytes that have arrived, and never because a length was
    // announced; by one byte more than is wanted, so that bytes behind the answer show.
    if (filled_ == buffer_.size()) {
      buffer_.resize(std::min(2 * filled_, std::max(parser_.needed(), filled_) + 1));
    }
    const ssize_t n =
        recv(channel_, buffer_.data() + filled_, buffer_.size() - filled_, MSG_DONTWAIT);
    if (n == 0 || (n < 0 && !wouldBlock())) return State::died;
    if (n < 0) return State::receiving;
    filled_ += static_cast<std::size_t>(n);
    switch (parser_.parse(received())) {
      case Protocol::ReplyParser::State::complete:
        return State::answered;
      case Protocol::ReplyParser::State::malformed:
        return State::violated;
      case Protocol::ReplyParser::State::incomplete:
        break;
    }
  }
  return State::receiving;
}

}  // namespace Keelgate
