// SPDX-License-Identifier: Apache-2.0
#include "framework/protocol/control_frames.h"

#include <sys/socket.h>
#include <unistd.h>
#include <cerrno>
#include <cstring>

namespace Keelgate::Protocol {

namespace {

/// Room for one descriptor; with more the kernel reports a truncation and closes them.
union DescriptorRoom {
  cmsghdr header;
  std::array<char, CMSG_SPACE(sizeof(int))> bytes;
};

constexpr int flagsFor(Waiting waiting) {
  return waiting == Waiting::no ? MSG_DONTWAIT : 0;
}

Transfer failedTransfer() noexcept {
  return errno == EAGAIN ? Transfer::wouldBlock : Transfer::ended;
}

/// A packet of one frame, with room for what goes along with it if there is any.
msghdr packetOf(iovec& piece, DescriptorRoom* room) noexcept {
  msghdr packet{};
  packet.msg_iov = &piece;
  packet.msg_iovlen = 1;
  if (room != nullptr) {
    packet.msg_control = room;
    packet.msg_controllen = sizeof *room;
  }
  return packet;
}

Transfer receivePacket(int channel, ControlFrame& frame, DescriptorRoom* room, msghdr& packet,
                       Waiting waiting) noexcept {
  // Apart, so that no part of `frame` is ever what was there before.
  ControlFrame received{};
  iovec piece{.iov_base = &received, .iov_len = sizeof received};
  packet = packetOf(piece, room);
  ssize_t size;
  do {
    size = recvmsg(channel, &packet, MSG_CMSG_CLOEXEC | flagsFor(waiting));
  } while (size < 0 && errno == EINTR);
  if (size < 0) return failedTransfer();
  if (size == 0) return Transfer::ended;
  const bool whole = size == sizeof received && (packet.msg_flags & (MSG_TRUNC | MSG_CTRUNC)) == 0;
  if (!whole || received.magic != magic || received.version != protocolVersion ||
      received.reserved != 0) {
    return Transfer::malformed;
  }
  frame = received;
  return Transfer::complete;
}

}  // namespace

ControlFrame makeControlFrame(ControlKind kind, std::uint32_t slot,
                              std::array<std::uint64_t, 4> numbers) noexcept {
  return {.magic = magic,
          .version = protocolVersion,
          .kind = kind,
          .slot = slot,
          .reserved = 0,
          .numbers = numbers};
}

Transfer sendControl(int channel, const ControlFrame& frame, int descriptor,
                     Waiting waiting) noexcept {
  // Without a signal: an application's handling of SIGPIPE is its own.
  const int flags = MSG_NOSIGNAL | flagsFor(waiting);
  // The kernel only reads through this pointer.
  iovec piece{.iov_base = const_cast<ControlFrame*>(&frame), .iov_len = sizeof frame};
  DescriptorRoom room{};
  msghdr packet = packetOf(piece, &room);
  cmsghdr* const item = CMSG_FIRSTHDR(&packet);
  item->cmsg_level = SOL_SOCKET;
  item->cmsg_type = SCM_RIGHTS;
  item->cmsg_len = CMSG_LEN(sizeof descriptor);
  std::memcpy(CMSG_DATA(item), &descriptor, sizeof descriptor);
  ssize_t size;
  do {
    // A frame alone by the simpler call, which is all that a zygote may make.
    size = descriptor == noDescriptor ? send(channel, &frame, sizeof frame, flags)
                                      : sendmsg(channel, &packet, flags);
  } while (size < 0 && errno == EINTR);
  return size < 0 ? failedTransfer() : Transfer::complete;
}

Transfer receiveControl(int channel, ControlFrame& frame, Waiting waiting) noexcept {
  msghdr packet;
  return receivePacket(channel, frame, nullptr, packet, waiting);
}

Transfer receiveControl(int channel, ControlFrame& frame, int& descriptor,
                        Waiting waiting) noexcept {
  descriptor = noDescriptor;
  DescriptorRoom room{};
  msghdr packet;
  const Transfer transfer = receivePacket(channel, frame, &room, packet, waiting);
  if (transfer != Transfer::complete && transfer != Transfer::malformed) return transfer;
  if (const cmsghdr* const item = CMSG_FIRSTHDR(&packet)) {
    if (item->cmsg_level != SOL_SOCKET || item->cmsg_type != SCM_RIGHTS) return Transfer::malformed;
    const auto* const first = reinterpret_cast<const int*>(CMSG_DATA(item));
    const std::size_t count = (item->cmsg_len - CMSG_LEN(0)) / sizeof descriptor;
    // In the room for one there is, by its alignment, room for two.
    for (std::size_t i = 1; i < count; ++i) close(first[i]);
    if (count > 0) descriptor = first[0];
    if (count > 1) packet.msg_flags |= MSG_CTRUNC;
  }
  if (transfer == Transfer::complete && (packet.msg_flags & MSG_CTRUNC) == 0 &&
      (descriptor != noDescriptor) == (frame.kind == ControlKind::fork)) {
    return Transfer::complete;
  }
  // What came with a frame that is refused has no other owner.
  if (descriptor != noDescriptor) close(descriptor);
  descriptor = noDescriptor;
  return Transfer::malformed;
}

std::uint64_t ownVersion() noexcept {
  return KEELGATE_VERSION_NUMBER;
}

std::string versionText(std::uint64_t version) {
  const auto part = [version](unsigned bits) {
    return std::to_string((version >> bits) & 0xffff);
  };
  return part(32) + '.' + part(16) + '.' + part(0);
}

}  // namespace Keelgate::Protocol
