// SPDX-License-Identifier: Apache-2.0
#include "framework/client/exchange.h"

#include "framework/contracts/memory_budget.h"

#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <new>

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
constexpr std::size_t firstBuffer = std::size_t{64} << 10;

/// The size of one, on most machines. A large block is in such pages where the kernel has them:
/// most of the time that a long reply takes would go into page faults.
constexpr std::size_t hugePage = std::size_t{2} << 20;

/// How often one step may go to the kernel: other messages and the deadline have their turn.
constexpr int callsPerStep = 16;

/// An interruption is the same: whoever waits for the channel goes on at once.
bool wouldBlock() noexcept {
  return errno == EAGAIN || errno == EINTR;
}

/// What goes to the kernel in one call.
class Pieces {
 public:
  [[nodiscard]] bool hasRoom() const noexcept { return count_ + 3 <= pieces_.size(); }
  void add(const void* from, std::size_t size) noexcept {
    // sendmsg only reads through this pointer.
    pieces_[count_++] = {.iov_base = const_cast<void*>(from), .iov_len = size};
  }
  void dropFront(std::size_t sent) noexcept {
    for (std::size_t i = 0; sent > 0; ++i) {
      const std::size_t taken = std::min(sent, pieces_[i].iov_len);
      pieces_[i].iov_base = static_cast<char*>(pieces_[i].iov_base) + taken;
      pieces_[i].iov_len -= taken;
      sent -= taken;
    }
  }
  [[nodiscard]] msghdr packet() noexcept {
    msghdr packet{};
    packet.msg_iov = pieces_.data();
    packet.msg_iovlen = count_;
    return packet;
  }

 private:
  std::array<iovec, 3 * 32> pieces_;
  std::size_t count_ = 0;
};

/// A mapping of so many bytes in place of a block, of which `used` are kept; null without one. It
/// is moved and not copied from the second time on.
void* remap(const std::unique_ptr<std::byte[], FreeBlock>& block, std::size_t used,
            std::size_t size) noexcept {
  const std::size_t mapped = block.get_deleter().mapped;
  void* const moved =
      mapped != 0 ? mremap(block.get(), mapped, size, MREMAP_MAYMOVE)
                  : mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (moved == MAP_FAILED) return nullptr;
  madvise(moved, size, MADV_HUGEPAGE);
  if (mapped == 0) {
    std::copy_n(block.get(), used, static_cast<std::byte*>(moved));
    std::free(block.get());
  }
  return moved;
}

std::size_t sizeOf(const Protocol::RequestHeader& header) noexcept {
  return sizeof header + header.serviceLength + header.bodyLength;
}

std::uint64_t largestReply(const OutgoingMessage& request) {
  // 64 bits hold it for the largest message that there is. A worker has what it answers with twice
  // at the end, as a record and as bytes, but for what is long.
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

std::span<std::byte> ReceiveBuffer::room(std::size_t wanted) {
  const std::size_t used = end_ - begin_;
  if (begin_ > 0) std::memmove(block_.get(), block_.get() + begin_, used);
  begin_ = 0;
  end_ = used;
  if (used == size_) {
    const std::size_t size = std::max(firstBuffer, std::min(2 * size_, std::max(wanted, used) + 1));
    grow(size);
  }
  return {block_.get() + end_, size_ - end_};
}

void FreeBlock::operator()(std::byte* block) const noexcept {
  if (mapped == 0) return std::free(block);
  munmap(block, mapped);
}

void ReceiveBuffer::grow(std::size_t size) {
  const bool isLarge = size >= hugePage;
  if (isLarge) size = (size + hugePage - 1) / hugePage * hugePage;
  auto* const grown = static_cast<std::byte*>(isLarge ? remap(block_, end_, size)
                                                      : std::realloc(block_.get(), size));
  if (grown == nullptr) throw std::bad_alloc();
  static_cast<void>(block_.release());
  block_ = {grown, FreeBlock{isLarge ? size : 0}};
  size_ = size;
}

void ReceiveBuffer::drop(std::size_t count) noexcept {
  begin_ += count;
  if (begin_ == end_) begin_ = end_ = 0;
}

void Exchange::add(const OutgoingMessage& request) {
  pending_.push_back({.header = Protocol::makeRequestHeader(request.record, request.command,
                                                            request.service.size(),
                                                            request.message.size(), nextSequence_),
                      .request = request});
  ++nextSequence_;
}

Exchange::State Exchange::advance() {
  const Pending& oldest = pending_.front();
  if (!parser_) parser_.emplace(oldest.header.sequence, largestReply(oldest.request));
  if (hasUnsent() && !isDeaf_) send();
  return state_ = receive();
}

Wait Exchange::wait(Deadline until) const noexcept {
  const int events = state_ == State::sending ? POLLIN | POLLOUT : POLLIN;
  return {.descriptor = channel_, .events = static_cast<short>(events), .until = until};
}

void Exchange::send() {
  for (int i = 0; i < callsPerStep && hasUnsent(); ++i) {
    // Many pieces and one call: messages, which may be large, are copied by the kernel alone.
    Pieces pieces;
    for (std::size_t at = sent_; at < pending_.size() && pieces.hasRoom(); ++at) {
      const auto& [header, request] = pending_[at];
      pieces.add(&header, sizeof header);
      pieces.add(request.service.data(), request.service.size());
      pieces.add(request.message.data(), request.message.size());
    }
    pieces.dropFront(sentBytes_);
    msghdr packet = pieces.packet();
    const ssize_t n = sendmsg(channel_, &packet, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (n < 0) {
      isDeaf_ = !wouldBlock();
      return;
    }
    sentBytes_ += static_cast<std::size_t>(n);
    for (; hasUnsent(); ++sent_) {
      const std::size_t size = sizeOf(pending_[sent_].header);
      if (sentBytes_ < size) break;
      sentBytes_ -= size;
    }
  }
}

Exchange::State Exchange::receive() {
  // A worker that answers before it has the whole request, and then reads no more, would never make
  // room: so both directions are watched.
  if (sent_ == 0) {
    const WorkerSign sign = isDeaf_ ? WorkerSign::gone : signOf(channel_);
    if (sign == WorkerSign::talking) return State::violated;
    return sign == WorkerSign::gone ? State::died : State::sending;
  }
  for (int i = 0;; ++i) {
    // What has arrived with the reply before may be all that there is to the next.
    if (const State state = parse(); state != State::receiving) return state;
    if (i == callsPerStep) break;
    const std::span<std::byte> room = buffer_.room(parser_->needed());
    const ssize_t n = recv(channel_, room.data(), room.size(), MSG_DONTWAIT);
    if (n == 0 || (n < 0 && !wouldBlock())) return State::died;
    if (n < 0) break;
    buffer_.add(static_cast<std::size_t>(n));
  }
  return hasUnsent() ? State::sending : State::receiving;
}

Exchange::State Exchange::parse() {
  using Parsed = Protocol::ReplyParser::State;
  const Bytes arrived = buffer_.bytes();
  for (;;) {
    const std::size_t looked = std::min(arrived.size(), parser_->needed());
    const Parsed parsed = parser_->parse(arrived.first(looked));
    if (parsed == Parsed::malformed) return State::violated;
    if (parsed == Parsed::complete) break;
    if (parser_->needed() > arrived.size()) return State::receiving;
  }
  // What lies behind the answer can only be that to a request which has been sent.
  return arrived.size() > parser_->needed() && sent_ < 2 ? State::violated : State::answered;
}

void Exchange::drop() noexcept {
  buffer_.drop(parser_->needed());
  parser_.reset();
  pending_.pop_front();
  --sent_;
}

}  // namespace Keelgate
