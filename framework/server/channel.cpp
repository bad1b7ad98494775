// SPDX-License-Identifier: Apache-2.0
/// Control frames come from the client, which is trusted, yet anything but an exact frame is fatal:
/// the zygote is the one process whose state every worker inherits.
#include "framework/server/channel.h"

#include "framework/sandbox/refusal.h"

#include <sys/socket.h>
#include <unistd.h>
#include <array>
#include <cerrno>
#include <cstring>

namespace Keelgate {

using Sandbox::Refusal;
using Transport::ControlFrame;
using Transport::ControlKind;
using Transport::Obstacle;
using Transport::serviceDescriptor;

namespace {

/// Room for one descriptor; with more the kernel reports a truncation and closes them.
union DescriptorRoom {
  cmsghdr header;
  std::array<char, CMSG_SPACE(sizeof(int))> bytes;
};

int descriptorOf(msghdr& packet) {
  const cmsghdr* const item = CMSG_FIRSTHDR(&packet);
  if (item == nullptr) return -1;
  if (item->cmsg_level != SOL_SOCKET || item->cmsg_type != SCM_RIGHTS ||
      item->cmsg_len != CMSG_LEN(sizeof(int))) {
    throw Refusal(Obstacle::badFrame, 0);
  }
  int descriptor = -1;
  std::memcpy(&descriptor, CMSG_DATA(item), sizeof descriptor);
  return descriptor;
}

}  // namespace

Optional<ReceivedControl> receiveControl() {
  ReceivedControl received{};
  DescriptorRoom room{};
  iovec place{.iov_base = &received.frame, .iov_len = sizeof received.frame};
  msghdr packet{};
  packet.msg_iov = &place;
  packet.msg_iovlen = 1;
  packet.msg_control = &room;
  packet.msg_controllen = sizeof room;
  const ssize_t size = recvmsg(serviceDescriptor, &packet, MSG_CMSG_CLOEXEC);
  if (size == 0 || (size < 0 && errno == ECONNRESET)) return std::nullopt;
  const bool whole = size == static_cast<ssize_t>(sizeof received.frame) &&
                     (packet.msg_flags & (MSG_TRUNC | MSG_CTRUNC)) == 0;
  if (!whole || received.frame.magic != Transport::magic ||
      received.frame.version != Transport::protocolVersion) {
    throw Refusal(Obstacle::badFrame, 0);
  }
  received.descriptor = descriptorOf(packet);
  // A fork brings a descriptor, and nothing else does.
  if ((received.descriptor >= 0) != (received.frame.kind == ControlKind::fork)) {
    throw Refusal(Obstacle::badFrame, 0);
  }
  return received;
}

void sendControl(ControlFrame frame) {
  frame.magic = Transport::magic;
  frame.version = Transport::protocolVersion;
  send(serviceDescriptor, &frame, sizeof frame, MSG_NOSIGNAL);
}

void endControl(const ControlFrame& last) {
  sendControl(last);
  // Whoever closes a channel with unread packets in it resets it, and the client would see the
  // reset in place of the last frame. So none may come any more, and those that came are read.
  shutdown(serviceDescriptor, SHUT_RD);
  msghdr discarded{};
  while (recvmsg(serviceDescriptor, &discarded, 0) > 0 || (discarded.msg_flags & MSG_TRUNC) != 0) {
    discarded = {};
  }
}

bool receiveAll(std::span<std::byte> bytes) {
  while (!bytes.empty()) {
    // read and write, and not recv and send: these two are all that the filter leaves a worker.
    const ssize_t got = read(serviceDescriptor, bytes.data(), bytes.size());
    if (got <= 0) return false;
    bytes = bytes.subspan(static_cast<std::size_t>(got));
  }
  return true;
}

bool sendAll(Bytes bytes) {
  while (!bytes.empty()) {
    const ssize_t sent = write(serviceDescriptor, bytes.data(), bytes.size());
    if (sent <= 0) return false;
    bytes = bytes.subspan(static_cast<std::size_t>(sent));
  }
  return true;
}

}  // namespace Keelgate
