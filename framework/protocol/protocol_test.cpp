// SPDX-License-Identifier: Apache-2.0
/// The control channel: what one end sends the other takes; anything that is not exactly right is
/// refused. Replies in pieces and frames with another head are tried by the harness of frames.
#include "framework/protocol/control_frames.h"
#include "framework/protocol/data_frames.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>
#include <array>
#include <cstring>
#include <filesystem>
#include <utility>
#include <vector>

namespace Keelgate::Protocol {
namespace {

/// Both ends of a control channel.
class Control : public testing::Test {
 protected:
  Control() { EXPECT_EQ(socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends_.data()), 0); }
  ~Control() override {
    for (const int end : ends_) close(end);
  }

  static std::ptrdiff_t openDescriptors() {
    return std::distance(std::filesystem::directory_iterator("/proc/self/fd"), {});
  }

  /// What the client's end, and the zygote's, make of the same packet.
  std::pair<Transfer, Transfer> taken(Bytes packet, const std::vector<int>& descriptors = {}) {
    std::pair<Transfer, Transfer> both{};
    send(packet, descriptors);
    ControlFrame frame{};
    both.first = receiveControl(ends_[1], frame, Waiting::no);
    send(packet, descriptors);
    // What comes with a refused frame is closed.
    const std::ptrdiff_t before = openDescriptors();
    int descriptor = noDescriptor;
    both.second = receiveControl(ends_[1], frame, descriptor, Waiting::no);
    EXPECT_EQ(descriptor != noDescriptor,
              both.second == Transfer::complete && !descriptors.empty());
    if (descriptor != noDescriptor) close(descriptor);
    EXPECT_EQ(openDescriptors(), before);
    return both;
  }

  std::array<int, 2> ends_{};

 private:
  void send(Bytes packet, const std::vector<int>& descriptors) {
    iovec piece{.iov_base = const_cast<std::byte*>(packet.data()), .iov_len = packet.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(4 * sizeof(int))> room{};
    msghdr message{};
    message.msg_iov = &piece;
    message.msg_iovlen = 1;
    if (!descriptors.empty()) {
      const std::size_t size = descriptors.size() * sizeof(int);
      message.msg_control = room.data();
      message.msg_controllen = CMSG_SPACE(size);
      cmsghdr* const item = CMSG_FIRSTHDR(&message);
      item->cmsg_level = SOL_SOCKET;
      item->cmsg_type = SCM_RIGHTS;
      item->cmsg_len = CMSG_LEN(size);
      std::memcpy(CMSG_DATA(item), descriptors.data(), size);
    }
    EXPECT_EQ(sendmsg(ends_[0], &message, 0), static_cast<ssize_t>(packet.size()));
  }
};

template <class T>
Bytes bytesOf(const T& value) {
  return std::as_bytes(std::span(&value, 1));
}

TEST_F(Control, FramesArriveWholeWithTheirDescriptorUntilTheEnd) {
  const ControlFrame fork = makeControlFrame(ControlKind::fork, 5, {1, 2, 3, 4});
  ASSERT_EQ(sendControl(ends_[0], fork, STDERR_FILENO, Waiting::no), Transfer::complete);
  ControlFrame received{};
  int descriptor = noDescriptor;
  ASSERT_EQ(receiveControl(ends_[1], received, descriptor, Waiting::yes), Transfer::complete);
  EXPECT_EQ(std::memcmp(&received, &fork, sizeof fork), 0);
  EXPECT_EQ(fcntl(descriptor, F_GETFD), FD_CLOEXEC);
  close(descriptor);
  EXPECT_EQ(receiveControl(ends_[1], received, Waiting::no), Transfer::wouldBlock);
  // A channel that is full is told from one that has ended.
  Transfer sent = Transfer::complete;
  while (sent == Transfer::complete) sent = sendControl(ends_[1], fork, noDescriptor, Waiting::no);
  EXPECT_EQ(sent, Transfer::wouldBlock);
  std::array<std::byte, 10> bytes{};
  ASSERT_TRUE(writeAll(ends_[0], bytes));
  EXPECT_TRUE(readAll(ends_[1], bytes));
  close(std::exchange(ends_[0], -1));
  EXPECT_EQ(receiveControl(ends_[1], received, Waiting::yes), Transfer::ended);
  EXPECT_EQ(sendControl(ends_[1], fork, noDescriptor, Waiting::yes), Transfer::ended);
  EXPECT_FALSE(readAll(ends_[1], bytes) || writeAll(ends_[1], bytes));
}

TEST_F(Control, OnlyAForkBringsADescriptorAndOnlyOne) {
  constexpr auto complete = Transfer::complete;
  constexpr auto malformed = Transfer::malformed;
  for (const ControlKind kind : {ControlKind::hello, ControlKind::kill, ControlKind::exit}) {
    EXPECT_EQ(taken(bytesOf(makeControlFrame(kind))), std::pair(complete, complete));
    EXPECT_EQ(taken(bytesOf(makeControlFrame(kind)), {2}), std::pair(malformed, malformed));
  }
  const ControlFrame fork = makeControlFrame(ControlKind::fork);
  EXPECT_EQ(taken(bytesOf(fork)), std::pair(complete, malformed));
  EXPECT_EQ(taken(bytesOf(fork), {2}), std::pair(malformed, complete));
  EXPECT_EQ(taken(bytesOf(fork), {2, 2}), std::pair(malformed, malformed));
  EXPECT_EQ(taken(bytesOf(fork), {2, 2, 2}), std::pair(malformed, malformed));
}

TEST(Version, IsReadBackAsText) {
  EXPECT_EQ(versionText((std::uint64_t{1} << 32) + (2 << 16) + 65535), "1.2.65535");
  EXPECT_NE(ownVersion(), 0u);
}

}  // namespace
}  // namespace Keelgate::Protocol
