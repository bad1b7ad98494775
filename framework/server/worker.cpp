// SPDX-License-Identifier: Apache-2.0
/// From a fork to its exit: seal, then header, body, answer for each message. There is no other
/// state, and no way back into the zygote.
#include "framework/server/worker.h"

#include "framework/contracts/memory_budget.h"
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/data_frames.h"
#include "framework/server/message_memory.h"

#include <unistd.h>
#include <algorithm>
#include <cstring>
#include <memory>
#include <new>

namespace Keelgate {

namespace {

using Protocol::ReplyKind;
using Protocol::RequestHeader;

/// The worker's end of its channel: a call for as many requests or replies as there are. What it
/// has to say is said before it waits. Its memory is there from the start, and not the message's.
class Channel {
 public:
  /// A request as long as that is read into the buffer: by its own length alone, so that what a
  /// message has of its memory does not depend on what came with it.
  static constexpr std::size_t buffered = std::size_t{64} << 10;

  /// The next `size` bytes, until the next call; at most `buffered`. The process ends where there
  /// are none.
  std::span<const std::byte> take(std::size_t size) {
    if (size > end_ - begin_) fill(size);
    begin_ += size;
    return {input_ + begin_ - size, size};
  }

  void takeInto(std::span<std::byte> bytes) {
    const auto there = take(std::min(bytes.size(), end_ - begin_));
    std::copy(there.begin(), there.end(), bytes.begin());
    flush();
    if (!Protocol::readAll(serviceDescriptor, bytes.subspan(there.size()))) _exit(0);
  }

  void give(Bytes bytes) {
    if (bytes.size() > sizeof output_ - filled_) flush();
    if (bytes.size() > sizeof output_) return write(bytes);
    std::copy(bytes.begin(), bytes.end(), output_ + filled_);
    filled_ += bytes.size();
  }

  void flush() {
    write({output_, filled_});
    filled_ = 0;
  }

 private:
  void fill(std::size_t size) {
    flush();
    std::copy(input_ + begin_, input_ + end_, input_);
    end_ -= begin_;
    begin_ = 0;
    while (end_ < size) {
      const ssize_t got = read(serviceDescriptor, input_ + end_, sizeof input_ - end_);
      if (got <= 0) _exit(0);
      end_ += static_cast<std::size_t>(got);
    }
  }
  /// Whoever does not listen any more has gone.
  static void write(Bytes bytes) {
    if (!Protocol::writeAll(serviceDescriptor, bytes)) _exit(0);
  }

  std::byte input_[buffered]{};
  std::size_t begin_ = 0;
  std::size_t end_ = 0;
  std::byte output_[buffered]{};
  std::size_t filled_ = 0;
};

/// In no memory that a worker would have to take, and none of which it touches before it needs it.
constinit Channel channel;

/// The next request's header. A wrong one comes from a client of another build, which must not get
/// an answer that it misreads.
RequestHeader receiveHeader(std::uint32_t sequence, std::uint64_t longestMessage) {
  RequestHeader header;
  std::memcpy(&header, channel.take(sizeof header).data(), sizeof header);
  // A message that is longer than the heap was fixed for would end for want of memory.
  if (!Protocol::isExpected(header, sequence, longestMessage)) {
    _exit(Protocol::protocolExitStatus);
  }
  return header;
}

void giveHeader(std::uint32_t sequence, ReplyKind kind, std::size_t size, bool last) {
  const auto header = Protocol::makeReplyHeader(sequence, kind, size, last);
  channel.give(std::as_bytes(std::span(&header, 1)));
}

void send(const Reply& reply, std::uint32_t sequence, bool last) {
  std::size_t lines = 0;
  // Cut here so that an honest worker keeps within what its client will take.
  for (const String& line : reply.log) {
    if (++lines > Protocol::maximumLogFrames) break;
    const Bytes bytes = std::as_bytes(std::span(line));
    const Bytes shown = bytes.first(std::min(bytes.size(), Protocol::maximumLogLength));
    giveHeader(sequence, ReplyKind::log, shown.size(), false);
    channel.give(shown);
  }
  giveHeader(sequence, reply.kind, reply.body.size(), last);
  reply.body.eachPart([](Bytes part) { channel.give(part); });
}

/// At once: nothing is destroyed.
[[noreturn]] void end() {
  channel.flush();
  _exit(0);
}

/// From the first byte of the body on, this is the part that a stranger may take over. Returns
/// only if another message may follow. A process cannot give back memory under its filter, so one
/// that has taken more than any short message may ends.
void answer(const KeelgateServer& server, const RequestHeader& header, bool isLast) {
  MessageMemory::begin(allocationLimit(header.bodyLength));
  const std::size_t size = header.serviceLength + header.bodyLength;
  std::unique_ptr<std::byte[]> large;
  Bytes bytes;
  if (size <= Channel::buffered) {
    bytes = channel.take(size);
  } else {
    // Not zeroed, because it is filled at once.
    large = std::make_unique_for_overwrite<std::byte[]>(size);
    channel.takeInto({large.get(), size});
    bytes = {large.get(), size};
  }
  const Bytes service = bytes.first(header.serviceLength);
  server.answer({.record = header.record,
                 .message = bytes.subspan(header.serviceLength),
                 .command = header.command,
                 .service = {reinterpret_cast<const char*>(service.data()), service.size()}},
                [&](const Reply& reply) {
                  // The client counts messages itself, and is told of an earlier end alone.
                  const bool isLarge = MessageMemory::peak() > allocationLimit(0);
                  send(reply, header.sequence, isLarge);
                  if (isLarge || isLast) end();
                });
}

}  // namespace

void work(const KeelgateServer& server, std::uint64_t messages,
          const Sandbox::WorkerSeal& seal) try {
  Sandbox::sealWorker(seal);
  for (std::uint32_t sequence = 0; sequence != messages; ++sequence) {
    answer(server, receiveHeader(sequence, seal.longestMessage), sequence + 1 == messages);
  }
  end();
} catch (const std::bad_alloc&) {
  // At once: whatever would run at an orderly exit wants memory, and calls that are forbidden.
  _exit(Protocol::resourceExitStatus);
} catch (const StartError&) {
  _exit(Protocol::refusedExitStatus);
}

}  // namespace Keelgate
