// SPDX-License-Identifier: Apache-2.0
/// Every call here is one that does not wait; waiting is done in one place, until the deadline. So
/// a worker that reads slowly, or sends a byte a second, costs the time limit and no more.
#include "framework/client/data_channel.h"

#include "framework/contracts/memory_budget.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>

namespace Keelgate {

namespace {

/// Most replies fit; room grows twofold from here with the bytes that have arrived.
constexpr std::size_t firstBuffer = 4096;

/// An interruption is the same: whoever asked goes round again, by way of the deadline.
bool wouldBlock() noexcept {
  return errno == EAGAIN || errno == EINTR;
}

/// Takes `sent` bytes off the front. Gives whether any are left.
bool advance(std::array<iovec, 3>& pieces, std::size_t sent) noexcept {
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

}  // namespace

DataChannel::Look DataChannel::look() const noexcept {
  char byte;
  const ssize_t n = recv(channel_.get(), &byte, 1, MSG_PEEK | MSG_DONTWAIT);
  if (n > 0) return Look::talking;
  return n < 0 && wouldBlock() ? Look::quiet : Look::gone;
}

Ending DataChannel::exchange(const ClientRequest& request, Deadline deadline,
                             ReceivedReply& reply) {
  if (const Ending sent = send(request, deadline); sent != Ending::answered) return sent;
  reply.memory = memoryBudget(request.message.size());
  // The worker had the body twice at the end, by itself and framed.
  const std::uint64_t allowance = std::min<std::uint64_t>(
      replyBase + request.service.size() + replyFactor * request.message.size(), heap_ / 2);
  const Ending received = receive(allowance, deadline, reply);
  ++sequence_;
  return received;
}

Ending DataChannel::send(const ClientRequest& request, Deadline deadline) const {
  const Protocol::RequestHeader header = Protocol::makeRequestHeader(
      request.record, request.command, request.service.size(), request.message.size(), sequence_);
  // Three pieces and one call: the message, which may be large, is copied by the kernel alone.
  Pieces pieces{pieceOf(&header, sizeof header),
                pieceOf(request.service.data(), request.service.size()),
                pieceOf(request.message.data(), request.message.size())};
  msghdr packet{};
  packet.msg_iov = pieces.data();
  packet.msg_iovlen = pieces.size();
  for (;;) {
    const ssize_t n = sendmsg(channel_.get(), &packet, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (n >= 0) {
      if (!advance(pieces, static_cast<std::size_t>(n))) return Ending::answered;
      if (Clock::now() >= deadline) return Ending::late;
    } else if (!wouldBlock()) {
      return Ending::died;
    } else if (const Ending ready = waitToSend(deadline); ready != Ending::answered) {
      return ready;
    }
  }
}

// A worker that answers before it has the whole request, and then reads no more, would block a
// writer that doesn't look: so both directions are watched.
Ending DataChannel::waitToSend(Deadline deadline) const noexcept {
  const short events = waitFor(channel_.get(), POLLIN | POLLOUT, deadline);
  if (events == 0) return Ending::late;
  if ((events & (POLLIN | POLLHUP | POLLERR)) == 0) return Ending::answered;
  switch (look()) {
    case Look::talking:
      return Ending::violation;
    case Look::gone:
      return Ending::died;
    case Look::quiet:
      return Ending::answered;
  }
  return Ending::died;
}

Ending DataChannel::receive(std::uint64_t allowance, Deadline deadline, ReceivedReply& reply) {
  filled_ = 0;
  reply.buffer.resize(firstBuffer);
  Protocol::ReplyParser parser(sequence_, allowance);
  for (;;) {
    const Bytes received = Bytes(reply.buffer).first(filled_);
    const auto state = parser.parse(received);
    reply.log = parser.log();
    if (state == Protocol::ReplyParser::State::malformed) return Ending::violation;
    if (state == Protocol::ReplyParser::State::complete) {
      reply.kind = parser.kind();
      reply.body = parser.body(received);
      return Ending::answered;
    }
    const Ending more = receiveMore(parser.needed(), deadline, reply);
    if (more != Ending::answered) return more;
  }
}

/// Until the buffer holds so many bytes. It grows when it is full of bytes that have arrived, and
/// never because a length was announced.
Ending DataChannel::receiveMore(std::size_t needed, Deadline deadline, ReceivedReply& reply) {
  while (filled_ < needed) {
    // One byte more than is wanted, so that bytes behind the answer show.
    if (filled_ == reply.buffer.size()) reply.buffer.resize(std::min(2 * filled_, needed + 1));
    if (waitFor(channel_.get(), POLLIN, deadline) == 0) return Ending::late;
    const ssize_t n = recv(channel_.get(), reply.buffer.data() + filled_,
                           reply.buffer.size() - filled_, MSG_DONTWAIT);
    if (n == 0 || (n < 0 && !wouldBlock())) return Ending::died;
    if (n > 0) filled_ += static_cast<std::size_t>(n);
    // A worker that never stops writing would never be waited for.
    if (filled_ < needed && Clock::now() >= deadline) return Ending::late;
  }
  return Ending::answered;
}

}  // namespace Keelgate
