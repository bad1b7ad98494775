// SPDX-License-Identifier: Apache-2.0
/// What a taken-over worker or zygote can send, and what the service's ends take: the frames of
/// both channels. The first byte says which; the second cuts the stream of a reply in pieces.
#include "framework/protocol/control_frames.h"
#include "framework/protocol/data_frames.h"
#include "fuzz/require.h"
#include "tests/reply_frame.h"

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <optional>
#include <span>

namespace {

using namespace Keelgate;
using namespace Keelgate::Protocol;
using Fuzz::require;
using Testing::appendReplyFrame;

/// What is made of the whole reply, or of what arrives of it in pieces of `step` bytes.
std::optional<ReplyParser> parsed(Bytes reply, std::size_t step, ReplyParser::State& state) {
  ReplyParser parser(7, 4096);
  state = ReplyParser::State::incomplete;
  for (std::size_t have = 0; have < reply.size() && state == ReplyParser::State::incomplete;) {
    have = std::min(have + step, reply.size());
    // A copy of exact size: what lies behind it has not arrived.
    const Data received(reply.begin(), reply.begin() + static_cast<std::ptrdiff_t>(have));
    state = parser.parse(received);
    if (state == ReplyParser::State::incomplete) {
      require(parser.needed() > have, "an incomplete reply needs more than there is");
    } else if (state == ReplyParser::State::complete) {
      require(have == reply.size() || step > 1, "a reply ends where it is complete");
      require(parser.body(received).size() <= 4096, "no body above what is allowed");
    }
  }
  require(parser.log().size() <= maximumLogFrames, "no more log lines than are allowed");
  if (state != ReplyParser::State::complete) return std::nullopt;
  return parser;
}

/// A reply that is whole is the same in whatever pieces it arrives, and has one spelling.
void checkReply(Bytes reply, std::size_t step) {
  ReplyParser::State state{};
  const auto whole = parsed(reply, reply.size() + 1, state);
  if (!whole) return;
  require(whole->kind() == ReplyKind::record || whole->kind() == ReplyKind::error,
          "a reply is a record or an error");
  const auto inPieces = parsed(reply, step, state);
  require(inPieces.has_value(), "a whole reply is one in pieces, too");
  Data again;
  for (const String& line : whole->log()) {
    appendReplyFrame(again, 7, ReplyKind::log, std::as_bytes(std::span(line)));
  }
  appendReplyFrame(again, 7, whole->kind(), whole->body(reply), whole->isLast());
  require(std::ranges::equal(again, reply), "one spelling of a reply");
  require(std::ranges::equal(whole->body(reply), inPieces->body(reply)), "one body of a reply");
}

/// A packet arrives at the client and at the zygote. What is taken is what would be made of it.
void checkControl(Bytes packet, bool hasDescriptor) {
  static const auto channel = [] {
    std::array<int, 2> ends{};
    require(socketpair(AF_UNIX, SOCK_SEQPACKET, 0, ends.data()) == 0, "a pair of sockets");
    return ends;
  }();
  for (const bool isZygote : {false, true}) {
    iovec piece{const_cast<std::byte*>(packet.data()), packet.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
    msghdr message{};
    message.msg_iov = &piece;
    message.msg_iovlen = 1;
    if (hasDescriptor) {
      message.msg_control = control.data();
      message.msg_controllen = control.size();
      cmsghdr* const header = CMSG_FIRSTHDR(&message);
      header->cmsg_level = SOL_SOCKET;
      header->cmsg_type = SCM_RIGHTS;
      header->cmsg_len = CMSG_LEN(sizeof(int));
      std::memcpy(CMSG_DATA(header), &channel[0], sizeof(int));
    }
    require(sendmsg(channel[0], &message, MSG_DONTWAIT) >= 0, "a packet is sent");
    ControlFrame frame{};
    int descriptor = noDescriptor;
    const Transfer transfer = isZygote ? receiveControl(channel[1], frame, descriptor, Waiting::no)
                                       : receiveControl(channel[1], frame, Waiting::no);
    if (descriptor != noDescriptor) close(descriptor);
    if (transfer != Transfer::complete) continue;
    require(hasDescriptor == (isZygote && frame.kind == ControlKind::fork),
            "a fork brings a descriptor and nothing else does");
    const ControlFrame made = makeControlFrame(frame.kind, frame.slot, frame.numbers);
    require(packet.size() == sizeof made && std::memcmp(&made, packet.data(), sizeof made) == 0,
            "one spelling of a control frame");
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size < 2) return 0;
  const Bytes bytes = std::as_bytes(std::span(data, size)).subspan(2);
  if (data[0] % 2 == 0) {
    checkReply(bytes, data[1] + std::size_t{1});
  } else if (!bytes.empty() && bytes.size() <= 4096) {
    checkControl(bytes, data[1] % 2 == 1);
  }
  return 0;
}
