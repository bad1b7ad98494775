// SPDX-License-Identifier: Apache-2.0
#include "framework/protocol/data_frames.h"

#include <unistd.h>
#include <cstring>

namespace Keelgate::Protocol {

bool isExpected(const RequestHeader& header, std::uint32_t sequence,
                std::uint64_t longestMessage) noexcept {
  return header.magic == magic && header.version == protocolVersion &&
         header.sequence == sequence && header.serviceLength <= maximumServiceLength &&
         header.bodyLength <= longestMessage;
}

ReplyHeader makeReplyHeader(std::uint32_t sequence, ReplyKind kind, std::uint64_t bodyLength,
                            bool last) noexcept {
  return {.magic = magic,
          .version = protocolVersion,
          .kind = kind,
          .sequence = sequence,
          .last = last ? 1U : 0U,
          .bodyLength = bodyLength};
}

bool readAll(int channel, std::span<std::byte> bytes) noexcept {
  while (!bytes.empty()) {
    // read and write, and not recv and send: these two are all that the filter leaves a worker.
    const ssize_t got = read(channel, bytes.data(), bytes.size());
    if (got <= 0) return false;
    bytes = bytes.subspan(static_cast<std::size_t>(got));
  }
  return true;
}

bool writeAll(int channel, Bytes bytes) noexcept {
  while (!bytes.empty()) {
    const ssize_t sent = write(channel, bytes.data(), bytes.size());
    if (sent <= 0) return false;
    bytes = bytes.subspan(static_cast<std::size_t>(sent));
  }
  return true;
}

RequestHeader makeRequestHeader(std::uint16_t record, std::uint64_t command,
                                std::size_t serviceLength, std::uint64_t bodyLength,
                                std::uint32_t sequence) noexcept {
  return {.magic = magic,
          .version = protocolVersion,
          .record = record,
          .sequence = sequence,
          .serviceLength = static_cast<std::uint32_t>(serviceLength),
          .bodyLength = bodyLength,
          .command = command};
}

ReplyParser::State ReplyParser::parse(Bytes received) {
  while (received.size() >= needed_) {
    ReplyHeader header;
    std::memcpy(&header, received.data() + next_, sizeof header);
    // Before the length is used for anything.
    if (!isExpected(header)) return State::malformed;
    needed_ = next_ + sizeof header + header.bodyLength;
    if (received.size() < needed_) break;
    kind_ = header.kind;
    last_ = header.last != 0;
    offset_ = next_ + sizeof header;
    length_ = header.bodyLength;
    // What lies behind the answer would be taken for the beginning of the next one.
    if (kind_ != ReplyKind::log) {
      return received.size() == needed_ ? State::complete : State::malformed;
    }
    const Bytes line = body(received);
    log_.emplace_back(reinterpret_cast<const char*>(line.data()), line.size());
    next_ = needed_;
    needed_ += sizeof header;
  }
  return State::incomplete;
}

bool ReplyParser::isExpected(const ReplyHeader& header) const noexcept {
  if (header.magic != magic || header.version != protocolVersion || header.sequence != sequence_ ||
      header.last > 1) {
    return false;
  }
  switch (header.kind) {
    case ReplyKind::log:
      return header.last == 0 && log_.size() < maximumLogFrames &&
             header.bodyLength <= maximumLogLength;
    case ReplyKind::record:
    case ReplyKind::error:
      return header.bodyLength <= largestBody_;
  }
  return false;
}

}  // namespace Keelgate::Protocol
