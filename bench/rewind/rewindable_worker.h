// SPDX-License-Identifier: Apache-2.0
/// A worker that is set back to the instant before it read its first byte, from outside, each time
/// that it ends.
///
/// It ends as every worker does, by exit_group with a status of 0: a filter turns that one call
/// into a notice to the process that traces it. Any other end is an end.
///
/// For one thread, and always the same: the tracer is a thread, not a process.
#pragma once

#include "bench/rewind/memory_image.h"
#include "bench/rewind/registers.h"

#include <keelgate/values.h>

#include <sys/types.h>

#include <functional>
#include <memory>

namespace Keelgate::Rewind {

/// Puts the process and all that it forks from now on under the filter that turns their ends into
/// notices, which can be read from the descriptor that is returned. no_new_privs must be set. The
/// process itself ends with `ownEnd` from then on. Throws StartError.
int noticeEnds();

/// A status that is 0 to whoever waits, and no 0 to the filter.
constexpr int ownEnd = 256;

/// An end that was noticed. The process waits in it.
struct End {
  pid_t process;
  std::uint64_t notice;
};
/// Nothing where the process is gone.
Optional<End> receiveEnd(int notices);
/// Lets a process end that is not to be set back.
void letEnd(int notices, const End& end);

/// Where a new process has its tracking for whoever takes it, before it closes all that it has.
constexpr int trackingDescriptor = 127;

class RewindableWorker {
 public:
  /// Forks a process that is going to run `body`, which seals it and then reads from the service's
  /// descriptor. It waits to be taken. -1 where there is none.
  static pid_t fork(const std::function<void()>& body);
  /// Takes such a process and lets it go on to its first read, where it is stopped and its image
  /// taken. `proc`: a directory with the processes, as this one sees them. Nothing if it does not
  /// get there; it has been waited for then. Throws std::system_error.
  static std::unique_ptr<RewindableWorker> take(int proc, pid_t process);
  /// Of a process that has not ended, it is its end.
  ~RewindableWorker();
  RewindableWorker(const RewindableWorker&) = delete;
  RewindableWorker& operator=(const RewindableWorker&) = delete;

  [[nodiscard]] pid_t process() const noexcept { return process_; }
  [[nodiscard]] const MemoryImage& memory() const noexcept { return memory_; }

  /// Lets it read, for the first time.
  [[nodiscard]] bool go() const;

  /// In a noticed end: takes its channel from it, so that its client sees the end. False when the
  /// worker is to be thrown away.
  [[nodiscard]] bool park(int notices, const End& end, int nowhere);
  [[nodiscard]] bool isParked() const noexcept { return parked_; }

  /// Sets a parked worker back and lets it read from `channel`, which stays the caller's. False
  /// when it is not to be used again.
  bool rewind(int notices, int channel);

  /// The two halves of it, for who wants to look at the worker in between: where it was stopped,
  /// and before its first read.
  bool stop(int notices, int channel);
  bool setBack();

  /// Nanoseconds of processor time since it was started.
  [[nodiscard]] std::uint64_t processorTime() const;

  /// It has been waited for by somebody else.
  void noteReaped() noexcept { process_ = 0; }

 private:
  RewindableWorker(pid_t process, MemoryFiles files);

  pid_t process_;
  MemoryImage memory_;
  Registers atEntry_;
  Registers beforeCall_;
  bool parked_ = false;
  std::uint64_t notice_ = 0;
};

/// Lets a stopped worker go on to the entry of its next system call. False when it does not come to
/// one.
bool runToCall(pid_t process);

}  // namespace Keelgate::Rewind
