// SPDX-License-Identifier: Apache-2.0
#include "bench/rewind/rewindable_worker.h"

#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/sandbox/limits.h"
#include "framework/sandbox/processes.h"

#include <fcntl.h>
#include <linux/audit.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <linux/userfaultfd.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/wait.h>

#include <csignal>
#include <cstddef>
#include <ctime>
#include <string>
#include <system_error>

namespace Keelgate::Rewind {

namespace {

/// More than that is not what a message of a short one's kind does; a fork is as cheap then.
constexpr std::size_t mostPages = 384;

/// What the stack does not need to be grown for any more: what is above it when a process starts.
constexpr std::size_t aboveStack = std::size_t{512} << 10;

int signalOf(int stop) {
  return WSTOPSIG(stop);
}
bool isEventStop(int stop) {
  return stop >> 16 == PTRACE_EVENT_STOP;
}
/// As PTRACE_O_TRACESYSGOOD tells it from a signal.
constexpr int callStop = SIGTRAP | 0x80;

/// The kernel grows the stack at a fault, without a call: its mapping is to be as it will be.
void growStack() {
  auto* const here = static_cast<volatile std::byte*>(__builtin_frame_address(0));
  here[-static_cast<std::ptrdiff_t>(Sandbox::stackLimit - aboveStack)] = std::byte{};
}

/// In the new process. It is open to its tracer until that has what it needs, and to nobody
/// afterwards; it has read nothing by then.
[[noreturn]] void live(const std::function<void()>& body) {
  prctl(PR_SET_DUMPABLE, 1, 0, 0, 0);
  const long tracking = syscall(SYS_userfaultfd, O_CLOEXEC | UFFD_USER_MODE_ONLY);
  if (tracking < 0 || dup3(static_cast<int>(tracking), trackingDescriptor, O_CLOEXEC) < 0)
    _exit(ownEnd);
  growStack();
  kill(getpid(), SIGSTOP);
  prctl(PR_SET_DUMPABLE, 0, 0, 0, 0);
  body();
  _exit(ownEnd);
}

File openFile(int proc, pid_t process, const char* name, int flags) {
  const std::string path = std::to_string(process) + '/' + name;
  return File(openat(proc, path.c_str(), flags | O_CLOEXEC));
}

MemoryFiles openFiles(int proc, pid_t process) {
  const File handle(static_cast<int>(syscall(SYS_pidfd_open, process, 0)));
  MemoryFiles files{
      .tracking =
          File(static_cast<int>(syscall(SYS_pidfd_getfd, handle.get(), trackingDescriptor, 0))),
      .memory = openFile(proc, process, "mem", O_RDWR),
      .pages = openFile(proc, process, "pagemap", O_RDONLY),
      .mappings = openFile(proc, process, "maps", O_RDONLY)};
  if (!files.tracking || !files.memory || !files.pages || !files.mappings) {
    throw std::system_error(errno, std::generic_category(), "files of a worker");
  }
  return files;
}

bool isReading(pid_t process) {
  user_regs_struct registers;
  return ptrace(PTRACE_GETREGS, process, nullptr, &registers) == 0 &&
         registers.orig_rax == SYS_read && registers.rdi == serviceDescriptor;
}

/// False when it ended on the way.
bool runToFirstRead(pid_t process) {
  do {
    if (!runToCall(process)) return false;
  } while (!isReading(process));
  return true;
}

}  // namespace

bool runToCall(pid_t process) {
  // Each call stops twice: at its entry the result is that of a call that does not exist.
  const auto atEntry = [process] {
    __ptrace_syscall_info info{};
    ptrace(PTRACE_GET_SYSCALL_INFO, process, reinterpret_cast<void*>(sizeof info), &info);
    return info.op == PTRACE_SYSCALL_INFO_ENTRY;
  };
  for (;;) {
    if (ptrace(PTRACE_SYSCALL, process, nullptr, nullptr) != 0) return false;
    int stop = 0;
    if (wait4(process, &stop, __WALL, nullptr) != process || !WIFSTOPPED(stop)) return false;
    if (signalOf(stop) == callStop && atEntry()) return true;
  }
}

int noticeEnds() {
  sock_filter program[]{
      BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, arch)),
      BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, AUDIT_ARCH_X86_64, 0, 4),
      BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
      BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_exit_group, 0, 2),
      BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, args)),
      BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, 0, 1, 0),
      BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
      BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_USER_NOTIF),
  };
  const sock_fprog handed{.len = std::size(program), .filter = program};
  const long notices =
      syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, SECCOMP_FILTER_FLAG_NEW_LISTENER, &handed);
  if (notices < 0) throw StartError(StartStep::loadFilter);
  return static_cast<int>(notices);
}

Optional<End> receiveEnd(int notices) {
  seccomp_notif notice{};
  if (ioctl(notices, SECCOMP_IOCTL_NOTIF_RECV, &notice) != 0) return std::nullopt;
  return End{.process = static_cast<pid_t>(notice.pid), .notice = notice.id};
}

void letEnd(int notices, const End& end) {
  seccomp_notif_resp answer{
      .id = end.notice, .val = 0, .error = 0, .flags = SECCOMP_USER_NOTIF_FLAG_CONTINUE};
  // It may have been killed meanwhile.
  static_cast<void>(ioctl(notices, SECCOMP_IOCTL_NOTIF_SEND, &answer));
}

pid_t RewindableWorker::fork(const std::function<void()>& body) {
  const pid_t process = Sandbox::forkSelf(0);
  if (process == 0) live(body);
  int status = 0;
  if (process < 0 || wait4(process, &status, WUNTRACED, nullptr) != process) return -1;
  return WIFSTOPPED(status) ? process : -1;
}

std::unique_ptr<RewindableWorker> RewindableWorker::take(int proc, pid_t process) try {
  if (ptrace(PTRACE_SEIZE, process, nullptr, PTRACE_O_EXITKILL | PTRACE_O_TRACESYSGOOD) != 0) {
    throw std::system_error(errno, std::generic_category(), "tracing of a worker");
  }
  MemoryFiles files = openFiles(proc, process);
  kill(process, SIGCONT);
  // Seized in its stop, it says so first.
  int status = 0;
  wait4(process, &status, __WALL, nullptr);
  if (!runToFirstRead(process)) return nullptr;
  return std::unique_ptr<RewindableWorker>(new RewindableWorker(process, std::move(files)));
} catch (const std::system_error&) {
  kill(process, SIGKILL);
  int status = 0;
  wait4(process, &status, __WALL, nullptr);
  throw;
}

RewindableWorker::RewindableWorker(pid_t process, MemoryFiles files)
    : process_(process), memory_(std::move(files)) {
  if (!readRegisters(process, atEntry_)) {
    throw std::system_error(errno, std::generic_category(), "registers");
  }
  beforeCall_ = Rewind::beforeCall(atEntry_);
}

RewindableWorker::~RewindableWorker() {
  if (process_ == 0) return;
  kill(process_, SIGKILL);
  int status = 0;
  do {
    if (wait4(process_, &status, __WALL, nullptr) != process_) return;
  } while (WIFSTOPPED(status));
}

bool RewindableWorker::go() const {
  return ptrace(PTRACE_CONT, process_, nullptr, nullptr) == 0;
}

namespace {

/// Makes a copy of `descriptor` the channel of a process that waits in a notice.
bool giveChannel(int notices, std::uint64_t notice, int descriptor) {
  seccomp_notif_addfd order{.id = notice,
                            .flags = SECCOMP_ADDFD_FLAG_SETFD,
                            .srcfd = static_cast<std::uint32_t>(descriptor),
                            .newfd = serviceDescriptor,
                            .newfd_flags = 0};
  return ioctl(notices, SECCOMP_IOCTL_NOTIF_ADDFD, &order) == serviceDescriptor;
}

}  // namespace

bool RewindableWorker::park(int notices, const End& end, int nowhere) {
  notice_ = end.notice;
  parked_ = giveChannel(notices, notice_, nowhere);
  return parked_;
}

bool RewindableWorker::stop(int notices, int channel) {
  parked_ = false;
  if (!giveChannel(notices, notice_, channel)) return false;
  if (ptrace(PTRACE_INTERRUPT, process_, nullptr, nullptr) != 0) return false;
  int stop = 0;
  if (wait4(process_, &stop, __WALL, nullptr) != process_) return false;
  if (!WIFSTOPPED(stop)) {
    process_ = 0;
    return false;
  }
  // Anything else has come to it meanwhile: a signal, or somebody who stops it.
  return isEventStop(stop) && signalOf(stop) == SIGTRAP;
}

bool RewindableWorker::setBack() {
  return memory_.restore(mostPages) && writeRegisters(process_, beforeCall_);
}

bool RewindableWorker::rewind(int notices, int channel) {
  return stop(notices, channel) && setBack() && go();
}

std::uint64_t RewindableWorker::processorTime() const {
  // As the kernel numbers the clocks of processes.
  const clockid_t clock = static_cast<clockid_t>((~static_cast<unsigned>(process_) << 3) | 2U);
  timespec used{};
  clock_gettime(clock, &used);
  return static_cast<std::uint64_t>(used.tv_sec) * 1'000'000'000 +
         static_cast<std::uint64_t>(used.tv_nsec);
}

}  // namespace Keelgate::Rewind
