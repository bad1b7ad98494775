// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/rewinding.h"

#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/sandbox/filter.h"
#include "framework/sandbox/limits.h"
#include "framework/sandbox/page_scan.h"

#include <sys/ioctl.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <algorithm>
#include <charconv>
#include <cstring>
#include <string>

namespace Keelgate::Sandbox {

namespace {

// Registers are set by their names.
#if defined __x86_64__ && !defined KEELGATE_UNSEALED
constexpr bool isPossible = true;
#else
constexpr bool isPossible = false;
#endif

[[noreturn]] void fail() {
  throw StartError(StartStep::watchProcesses);
}

/// Of this process namespace, without the kernel's own settings, and mounted nowhere.
int openProcesses() {
  const auto context = static_cast<int>(syscall(SYS_fsopen, "proc", FSOPEN_CLOEXEC));
  if (context < 0) return -1;
  const bool made = syscall(SYS_fsconfig, context, FSCONFIG_SET_STRING, "subset", "pid", 0) == 0 &&
                    syscall(SYS_fsconfig, context, FSCONFIG_CMD_CREATE, nullptr, nullptr, 0) == 0;
  const long mounted = made ? syscall(SYS_fsmount, context, FSMOUNT_CLOEXEC,
                                      MOUNT_ATTR_NOSUID | MOUNT_ATTR_NODEV | MOUNT_ATTR_NOEXEC)
                            : -1;
  close(context);
  return static_cast<int>(mounted);
}

/// Makes a descriptor one of a fixed number.
bool settle(int descriptor, int number) {
  if (descriptor < 0) return false;
  const bool settled = dup3(descriptor, number, O_CLOEXEC) == number;
  close(descriptor);
  return settled;
}

/// The kernel grows the stack at a fault, without a call: its mapping is to be as it will be.
void growStack() {
  // What lies above when a process starts.
  constexpr std::size_t above = std::size_t{512} << 10;
  auto* const here = static_cast<volatile std::byte*>(__builtin_frame_address(0));
  here[-static_cast<std::ptrdiff_t>(stackLimit - above)] = std::byte{};
}

int openOwn(const char* name, int flags) {
  const long file = syscall(SYS_openat, processesDescriptor, name, flags | O_CLOEXEC);
  if (file < 0) fail();
  return static_cast<int>(file);
}

std::string readMappings() {
  const int file = openOwn("self/maps", O_RDONLY);
  std::string text;
  std::array<char, 4096> piece;
  for (ssize_t got; (got = read(file, piece.data(), piece.size())) > 0;) {
    text.append(piece.data(), static_cast<std::size_t>(got));
  }
  close(file);
  return text;
}

WorkerAreas readAreas() {
  WorkerAreas all{.count = 1, .areas = {}};
  const std::string text = readMappings();
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t end = std::min(text.find('\n', at), text.size());
    const std::string line = text.substr(at, end - at);
    at = end + 1;
    // As in "7f00-7fff rw-p".
    WritableArea area{};
    const char* const behind = line.data() + line.size();
    const auto first = std::from_chars(line.data(), behind, area.begin, 16);
    const auto last = std::from_chars(std::min(first.ptr + 1, behind), behind, area.end, 16);
    if (last.ec != std::errc() || behind - last.ptr < 3) fail();
    if (last.ptr[2] != 'w') continue;
    if (line.ends_with("[stack]")) {
      all.areas[0] = area;
    } else if (all.count > 1 && all.areas[all.count - 1].end == area.begin) {
      all.areas[all.count - 1].end = area.end;
    } else if (all.count < all.areas.size()) {
      all.areas[all.count++] = area;
    } else {
      fail();
    }
  }
  if (all.areas[0].end == 0) fail();
  return all;
}

/// From now on the kernel can note which pages of these areas are written.
int track(const WorkerAreas& all) {
  const auto tracking = static_cast<int>(syscall(SYS_userfaultfd, trackingFlags));
  uffdio_api api{
      .api = UFFD_API, .features = protectUnpopulated | protectAsynchronously, .ioctls = 0};
  if (tracking < 0 || ioctl(tracking, UFFDIO_API, &api) != 0) fail();
  for (std::size_t i = 0; i < all.count; ++i) {
    const WritableArea& area = all.areas[i];
    uffdio_register range{.range = {.start = area.begin, .len = area.end - area.begin},
                          .mode = UFFDIO_REGISTER_MODE_WP,
                          .ioctls = 0};
    if (ioctl(tracking, UFFDIO_REGISTER, &range) != 0) fail();
  }
  return tracking;
}

void send(const WorkerAreas& all, const std::array<int, handedCount>& descriptors) {
  alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof descriptors)> room{};
  iovec piece{.iov_base = const_cast<WorkerAreas*>(&all), .iov_len = sizeof all};
  msghdr packet{};
  packet.msg_iov = &piece;
  packet.msg_iovlen = 1;
  packet.msg_control = room.data();
  packet.msg_controllen = room.size();
  cmsghdr* const item = CMSG_FIRSTHDR(&packet);
  item->cmsg_level = SOL_SOCKET;
  item->cmsg_type = SCM_RIGHTS;
  item->cmsg_len = CMSG_LEN(sizeof descriptors);
  std::memcpy(CMSG_DATA(item), descriptors.data(), sizeof descriptors);
  if (sendmsg(handoverSender, &packet, MSG_NOSIGNAL) != sizeof all) fail();
}

}  // namespace

bool prepareRewinding() {
  int ends[2];
  if (!isPossible || !settle(openProcesses(), processesDescriptor)) return false;
  if (socketpair(AF_UNIX, SOCK_SEQPACKET, 0, ends) != 0) return false;
  return settle(ends[0], handoverReceiver) && settle(ends[1], handoverSender);
}

void abandonRewinding() {
  for (const int descriptor : {processesDescriptor, handoverReceiver, handoverSender}) {
    close(descriptor);
  }
}

void renounceRewinding() {
  abandonRewinding();
  enforce(compile(zygoteRules));
}

void handOver() {
  // First of all: what is traced can be traced by nobody else.
  if (ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) != 0) fail();
  growStack();
  // The files of a process that is not dumpable are root's, its own included.
  prctl(PR_SET_DUMPABLE, 1, 0, 0, 0);
  const int memory = openOwn("self/mem", O_RDWR);
  const int pages = openOwn("self/pagemap", O_RDONLY);
  const WorkerAreas areas = readAreas();
  prctl(PR_SET_DUMPABLE, 0, 0, 0, 0);
  const int tracking = track(areas);
  const int notices =
      enforce(compile(returningRules, SECCOMP_RET_ALLOW), SECCOMP_FILTER_FLAG_NEW_LISTENER);
  send(areas, {tracking, memory, pages, notices});
}

void awaitChannel() {
  // Deliberate: the call returns, with the number of the channel, when the zygote answers it.
  if (syscall(SYS_exit_group, waitingStatus) != serviceDescriptor) fail();
}

}  // namespace Keelgate::Sandbox
