// SPDX-License-Identifier: Apache-2.0
#include "framework/server/rewindable_worker.h"

#include "framework/contracts/process.h"

#include <linux/seccomp.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/ptrace.h>
#include <sys/socket.h>

#include <array>
#include <csignal>
#include <cstring>

namespace Keelgate {

namespace {

/// What a new worker has sent; nothing when it is not what it should be.
Optional<WorkerFiles> receiveFiles() {
  WorkerFiles files;
  alignas(cmsghdr) std::array<char, CMSG_SPACE(Sandbox::handedCount * sizeof(int))> room{};
  iovec piece{.iov_base = &files.areas, .iov_len = sizeof files.areas};
  msghdr packet{};
  packet.msg_iov = &piece;
  packet.msg_iovlen = 1;
  packet.msg_control = room.data();
  packet.msg_controllen = room.size();
  const ssize_t size = recvmsg(Sandbox::handoverReceiver, &packet, MSG_CMSG_CLOEXEC | MSG_DONTWAIT);
  const cmsghdr* const item = size < 0 ? nullptr : CMSG_FIRSTHDR(&packet);
  if (item == nullptr) return std::nullopt;
  // As many as there was room for; the kernel has installed no others.
  std::array<int, Sandbox::handedCount> descriptors{-1, -1, -1, -1};
  std::memcpy(descriptors.data(), CMSG_DATA(item), item->cmsg_len - CMSG_LEN(0));
  files.tracking = File(descriptors[Sandbox::handedTracking]);
  files.memory = File(descriptors[Sandbox::handedMemory]);
  files.pages = File(descriptors[Sandbox::handedPages]);
  files.notices = File(descriptors[Sandbox::handedNotices]);
  if (size != sizeof files.areas || !files.notices) return std::nullopt;
  return files;
}

}  // namespace

void RewindableWorker::forgetHandedOver() {
  while (receiveFiles()) continue;
}

int RewindableWorker::startStep() const noexcept {
  if (asked_) return -1;
  return files_ ? files_->notices.get() : Sandbox::handoverReceiver;
}

bool RewindableWorker::takeStep() {
  if (!files_) return (files_ = receiveFiles()).has_value();
  // It waits for its channel, sealed. Stopped, it forgets that, and makes the call anew.
  asked_ = true;
  return kill(process_, SIGSTOP) == 0;
}

bool RewindableWorker::keep() {
  constexpr std::size_t options = PTRACE_O_EXITKILL | PTRACE_O_TRACESECCOMP;
  Registers inCall;
  if (!asked_ ||
      ptrace(PTRACE_SETOPTIONS, process_, nullptr, reinterpret_cast<void*>(options)) != 0 ||
      !readRegisters(process_, inCall) || !memory_.take(*files_)) {
    return false;
  }
  registers_ = beforeCall(std::move(inCall));
  return ready_ = writeRegisters(process_, registers_);
}

bool RewindableWorker::give(int channel) {
  const int notices = files_->notices.get();
  pollfd waiting{.fd = notices, .events = POLLIN, .revents = 0};
  constexpr timespec atOnce{};
  if (ppoll(&waiting, 1, &atOnce, nullptr) != 1 || (waiting.revents & POLLIN) == 0) return false;
  seccomp_notif notice{};
  if (ioctl(notices, SECCOMP_IOCTL_NOTIF_RECV, &notice) != 0) return false;
  seccomp_notif_addfd order{.id = notice.id,
                            .flags = SECCOMP_ADDFD_FLAG_SETFD | SECCOMP_ADDFD_FLAG_SEND,
                            .srcfd = static_cast<std::uint32_t>(channel),
                            .newfd = serviceDescriptor,
                            .newfd_flags = 0};
  if (ioctl(notices, SECCOMP_IOCTL_NOTIF_ADDFD, &order) != serviceDescriptor) {
    // Its call has been taken and would never be answered.
    kill(process_, SIGKILL);
    return false;
  }
  channel_ = File(channel);
  return true;
}

void RewindableWorker::hangUp() {
  shutdown(channel_.get(), SHUT_RDWR);
  channel_ = File();
}

bool RewindableWorker::rewind() {
  return memory_.restore(*files_) && writeRegisters(process_, registers_);
}

bool RewindableWorker::goOn(int signal) {
  return ptrace(PTRACE_CONT, process_, nullptr,
                reinterpret_cast<void*>(static_cast<std::size_t>(signal))) == 0;
}

}  // namespace Keelgate
