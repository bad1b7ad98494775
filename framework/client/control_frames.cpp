// SPDX-License-Identifier: Apache-2.0
#include "framework/client/control_frames.h"

#include <poll.h>
#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <cstring>

namespace Keelgate {

using Transport::ControlFrame;

ControlFrame makeFrame(Transport::ControlKind kind, std::uint32_t slot) noexcept {
  ControlFrame frame{};
  frame.magic = Transport::magic;
  frame.version = Transport::protocolVersion;
  frame.kind = kind;
  frame.slot = slot;
  return frame;
}

bool sendFrame(int control, const ControlFrame& frame, int descriptor, Deadline deadline) noexcept {
  iovec piece{.iov_base = const_cast<ControlFrame*>(&frame), .iov_len = sizeof frame};
  alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof descriptor)> extra{};
  msghdr packet{};
  packet.msg_iov = &piece;
  packet.msg_iovlen = 1;
  if (descriptor != noDescriptor) {
    packet.msg_control = extra.data();
    packet.msg_controllen = extra.size();
    cmsghdr* header = CMSG_FIRSTHDR(&packet);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof descriptor);
    std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
  }
  for (;;) {
    // Without a signal: the application's handling of SIGPIPE is its own.
    if (sendmsg(control, &packet, MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) return true;
    if (errno == EINTR) continue;
    if (errno != EAGAIN) return false;
    if (waitFor(control, POLLOUT, deadline) == 0) return false;
  }
}

Received receiveFrame(int control, ControlFrame& frame) noexcept {
  // One byte more than a frame, so that a longer packet shows.
  std::array<std::byte, sizeof frame + 1> packet;
  ssize_t n;
  do {
    n = recv(control, packet.data(), packet.size(), MSG_DONTWAIT);
  } while (n < 0 && errno == EINTR);
  if (n < 0 && errno == EAGAIN) return Received::nothing;
  if (n != sizeof frame) return Received::end;
  // Copied only when it has its length, so that no part of `frame` is ever what was there before.
  std::memcpy(&frame, packet.data(), sizeof frame);
  const bool right = frame.magic == Transport::magic && frame.version == Transport::protocolVersion;
  return right ? Received::frame : Received::end;
}

}  // namespace Keelgate
