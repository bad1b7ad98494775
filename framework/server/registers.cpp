// SPDX-License-Identifier: Apache-2.0
#include "framework/server/registers.h"

#include <elf.h>
#include <sys/ptrace.h>
#include <sys/uio.h>

#include <cstring>

#if defined __x86_64__
#include <sys/reg.h>
#endif

namespace Keelgate {

namespace {

/// More than any processor has.
constexpr std::size_t largestExtended = std::size_t{16} << 10;

bool getSet(pid_t process, unsigned which, iovec& set) {
  return ptrace(PTRACE_GETREGSET, process, reinterpret_cast<void*>(std::size_t{which}), &set) == 0;
}

bool putSet(pid_t process, unsigned which, const void* from, std::size_t size) {
  // The kernel only reads it.
  iovec set{.iov_base = const_cast<void*>(from), .iov_len = size};
  return ptrace(PTRACE_SETREGSET, process, reinterpret_cast<void*>(std::size_t{which}), &set) == 0;
}

bool readGeneral(pid_t process, elf_gregset_t& general) {
  iovec set{.iov_base = &general, .iov_len = sizeof general};
  return getSet(process, NT_PRSTATUS, set) && set.iov_len == sizeof general;
}

}  // namespace

bool readRegisters(pid_t process, Registers& registers) {
  registers.extended.resize(largestExtended);
  iovec set{.iov_base = registers.extended.data(), .iov_len = registers.extended.size()};
  if (!getSet(process, NT_X86_XSTATE, set)) return false;
  registers.extended.resize(set.iov_len);
  return readGeneral(process, registers.general);
}

bool writeRegisters(pid_t process, const Registers& registers) {
  if (!putSet(process, NT_PRSTATUS, &registers.general, sizeof registers.general) ||
      !putSet(process, NT_X86_XSTATE, registers.extended.data(), registers.extended.size())) {
    return false;
  }
  // The sets of 32-bit code have other sizes, and take a part of these.
  elf_gregset_t now;
  return readGeneral(process, now) && std::memcmp(&now, &registers.general, sizeof now) == 0;
}

Registers beforeCall(Registers inCall) {
  // Elsewhere no worker is made rewindable.
#if defined __x86_64__
  constexpr unsigned long long lengthOfCall = 2;
  inCall.general[RIP] -= lengthOfCall;
  inCall.general[RAX] = inCall.general[ORIG_RAX];
  // Not in a call: or the kernel would start it over by itself.
  inCall.general[ORIG_RAX] = ~0ULL;
#endif
  return inCall;
}

}  // namespace Keelgate
