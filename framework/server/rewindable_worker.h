// SPDX-License-Identifier: Apache-2.0
/// A worker that is rewound, from outside and each time that it ends, to the instant before it
/// got its channel: sealed, and with nothing read.
///
/// It ends as every worker does, by exit_group with a status of 0: a filter in front of its own
/// stops it there. Any other end is an end.
///
/// For one thread, and always the same: the tracer is a thread, not a process.
#pragma once

#include "framework/server/memory_image.h"
#include "framework/server/registers.h"

#include <sys/types.h>

namespace Keelgate {

class RewindableWorker {
 public:
  /// A process that is going to hand over. It stays its zygote's to be waited for.
  explicit RewindableWorker(pid_t process) noexcept : process_(process) {}

  /// What a worker has handed over that has ended before it was ready.
  static void forgetHandedOver();

  [[nodiscard]] pid_t process() const noexcept { return process_; }

  /// Getting ready, in steps: `takeStep` when what `startStep` gives is readable, and at its first
  /// stop `keep`, which takes the image. False when nothing comes of it.
  [[nodiscard]] int startStep() const noexcept;
  bool takeStep();
  bool keep();
  [[nodiscard]] bool isReady() const noexcept { return ready_; }

  /// Lets it go with a channel, which is its own from then on. False when it does not wait for one.
  bool give(int channel);

  /// When it has stopped at its end: its client is to see the end.
  void hangUp();
  /// Then restores its memory and its registers. False when it is to be thrown away.
  bool rewind();
  /// Out of a stop, with a signal or without. False when it is not stopped.
  bool goOn(int signal = 0);

 private:
  pid_t process_;
  bool asked_ = false;
  bool ready_ = false;
  Optional<WorkerFiles> files_;
  MemoryImage memory_;
  Registers registers_;
  /// The zygote's copy of its end.
  File channel_;
};

}  // namespace Keelgate
