// SPDX-License-Identifier: Apache-2.0
/// What a taken-over process can ask of the processor itself, without a library in between.
#pragma once

#include <array>
#include <cstddef>

namespace Keelgate::Test {

/// The number of a system call and its arguments.
using RawCall = std::array<long, 7>;

#if defined __x86_64__

/// Ways into the kernel beside the one that a filter is written for.
inline constexpr bool hasOtherGates = true;

inline long callKernel(const RawCall& a) {
  long result = a[0];
  register long r10 asm("r10") = a[4];
  register long r8 asm("r8") = a[5];
  register long r9 asm("r9") = a[6];
  asm volatile("syscall"
               : "+a"(result)
               : "D"(a[1]), "S"(a[2]), "d"(a[3]), "r"(r10), "r"(r8), "r"(r9)
               : "memory", "rcx", "r11");
  return result;
}

inline long callByGate(long number, long first) {
  long result = number;
  asm volatile("int $0x80"
               : "+a"(result)
               : "b"(first), "c"(0), "d"(0)
               : "memory", "r8", "r9", "r10", "r11");
  return result;
}

inline long callVsyscall(long slot) {
  using Function = long (*)(long, long);
  return reinterpret_cast<Function>(0xffff'ffff'ff60'0000 + static_cast<std::size_t>(slot) * 1024)(
      0, 0);
}

#elif defined __aarch64__

inline constexpr bool hasOtherGates = false;

inline long callKernel(const RawCall& a) {
  register long x8 asm("x8") = a[0];
  register long x0 asm("x0") = a[1];
  register long x1 asm("x1") = a[2];
  register long x2 asm("x2") = a[3];
  register long x3 asm("x3") = a[4];
  register long x4 asm("x4") = a[5];
  register long x5 asm("x5") = a[6];
  asm volatile("svc #0"
               : "+r"(x0)
               : "r"(x8), "r"(x1), "r"(x2), "r"(x3), "r"(x4), "r"(x5)
               : "memory");
  return x0;
}

[[noreturn]] inline long callByGate(long, long) {
  __builtin_trap();
}
[[noreturn]] inline long callVsyscall(long) {
  __builtin_trap();
}

#endif

}  // namespace Keelgate::Test
