// SPDX-License-Identifier: Apache-2.0
/// All registers of a process that is stopped under its tracer, which alone may call this.
#pragma once

#include <sys/procfs.h>
#include <sys/types.h>

#include <cstddef>
#include <vector>

namespace Keelgate {

struct Registers {
  /// With the segments and their bases.
  elf_gregset_t general{};
  /// x87, vector and mask registers, protection keys, their control words: all that the processor
  /// saves as one block, with the mask of what is in use.
  std::vector<std::byte> extended;
};

/// False when it cannot be done, or is not complete: a process that has switched to 32-bit code has
/// another set.
bool readRegisters(pid_t process, Registers& registers);

/// Sets all, and looks whether it came true: the kernel leaves out flags that it does not let a
/// tracer change. False when it did not.
bool writeRegisters(pid_t process, const Registers& registers);

/// Those of a process that makes the call again in which it was interrupted with these.
Registers beforeCall(Registers inCall);

}  // namespace Keelgate
