// SPDX-License-Identifier: Apache-2.0
/// All that can be seen of a stopped worker from outside, to be compared. For root, who may look at
/// a process that is not open to others.
#pragma once

#include "bench/rewind/memory_image.h"
#include "bench/rewind/registers.h"

#include <cstddef>
#include <map>
#include <string>
#include <vector>

namespace Keelgate::Rewind {

struct WorkerState {
  Registers registers;
  /// By address. A page that is not there reads as zeros.
  std::map<std::uint64_t, std::vector<std::byte>> pages;
  /// Lines of /proc/PID: mappings, limits, status, descriptors.
  std::vector<std::string> figures;
};

/// Throws std::system_error.
WorkerState lookAt(pid_t process);

struct Difference {
  /// In bytes. What the kernel itself writes for a thread, the number of its processor, is left
  /// out.
  std::size_t memory = 0;
  std::size_t general = 0;
  std::size_t extended = 0;
  /// Lines of /proc/PID, without those that only count: time, faults, switches, pages.
  std::vector<std::string> figures;

  [[nodiscard]] bool isNone() const {
    return memory == 0 && general == 0 && extended == 0 && figures.empty();
  }
};
Difference compare(const WorkerState& before, const WorkerState& after);

}  // namespace Keelgate::Rewind
