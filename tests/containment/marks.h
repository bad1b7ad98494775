// SPDX-License-Identifier: Apache-2.0
/// Stands for a parser that was taken over, and tries to leave something for the next message. For
/// one test, which includes it.
#pragma once

#include "framework/contracts/process.h"
#include "framework/sandbox/limits.h"

#include <sys/rseq.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cstdint>
#include <cstdlib>
#include <string_view>

namespace Keelgate::Test {

struct Mark {
  std::string_view name;
  void (*leave)();
  /// Whether its worker cannot be rewound: it has ended, or is to be thrown away.
  bool ends;
};

constexpr std::size_t page = 4096;
constexpr int pattern = 0x5a;

inline std::array<char, 3 * page> zeroed;
inline std::array<char, 64> initialised{"initialised"};
inline thread_local std::array<char, 64> ofThread{"of the thread"};

/// An end at once: code that leaves marks does not want them to be written over.
#define END "mov $231, %%eax\n\t mov $0, %%edi\n\t syscall\n\t ud2"
static_assert(SYS_exit_group == 231);

inline void nothing() {}

inline void fill(void* from, std::size_t size) {
  volatile char* const bytes = static_cast<char*>(from);
  for (std::size_t at = 0; at < size; ++at) bytes[at] = pattern;
}

inline void staticData() {
  fill(zeroed.data(), zeroed.size());
  fill(initialised.data(), initialised.size());
  fill(ofThread.data(), ofThread.size());
  _exit(0);
}

/// The allocator's own lists too, and pages that nobody has touched before.
inline void heap() {
  for (int size = 16; size < 4096; size += 16) {
    void* const block = std::malloc(static_cast<std::size_t>(size));
    fill(block, static_cast<std::size_t>(size));
    if (size % 3 == 0) std::free(block);
  }
  constexpr std::size_t far = std::size_t{64} << 20;
  char* const large = static_cast<char*>(std::malloc(far));
  for (std::size_t at = 0; at < far; at += far / 64) fill(large + at, 8);
  _exit(0);
}

template <std::size_t Depth>
[[gnu::noinline]] void stack() {
  volatile char* const here = static_cast<char*>(__builtin_frame_address(0));
  for (std::size_t at = page; at < Depth; at += 64 * page)
    here[-static_cast<std::ptrdiff_t>(at)] = pattern;
  _exit(0);
}

/// Written by the kernel, on the process's behalf.
inline void readIntoMemory() {
  char* const block = static_cast<char*>(std::malloc(16 * page));
  if (read(serviceDescriptor, block + 5 * page, page) <= 0) abort();
  _exit(0);
}

/// A critical section that is nowhere, for the kernel to jump out of at the next interruption.
inline void restartableSequence() {
  auto* const area = reinterpret_cast<struct rseq*>(static_cast<char*>(__builtin_thread_pointer()) +
                                                    __rseq_offset);
  // In one write, and over before it can be seen.
  asm volatile("movq $0x1000, %0\n\t" END : "=m"(area->rseq_cs));
}

inline void generalRegisters() {
  asm volatile(
      "mov $0x5a5a5a5a5a5a5a5a, %rbx\n\t .irp r,dx,si,8,9,10,12,13,14,15,bp,sp\n\t"
      "mov %rbx, %r\\r\n\t .endr\n\t mov $231, %eax\n\t xor %edi, %edi\n\t syscall\n\t ud2");
}

[[gnu::target("avx512f,avx512bw")]] inline void widestRegisters() {
  asm volatile(".irp n,0,1,2,3,4,5,6,7,8,9,10,11,12,13,14,15\n\t"
               "vpternlogd $0xff, %zmm\\n, %zmm\\n, %zmm\\n\n\t .endr\n\t"
               ".irp n,16,20,24,28,29,30,31\n\t"
               "vpternlogd $0xff, %zmm\\n, %zmm\\n, %zmm\\n\n\t .endr\n\t"
               ".irp n,0,1,2,3,4,5,6,7\n\t kxnorq %k\\n, %k\\n, %k\\n\n\t .endr");
}

inline void vectorRegisters() {
  static const std::uint32_t control = 0xffbf;
  static const std::uint16_t x87Control = 0x0e3f;
  if (__builtin_cpu_supports("avx512bw") != 0) {
    widestRegisters();
  } else {
    asm volatile("pcmpeqd %%xmm0, %%xmm0\n\t pcmpeqd %%xmm15, %%xmm15" ::: "memory");
  }
  asm volatile("ldmxcsr %0\n\t fldcw %1\n\t fldpi\n\t fldpi\n\t" END ::"m"(control),
               "m"(x87Control));
}

template <unsigned long Flags>
void flags() {
  asm volatile("pushfq\n\t orq %0, (%%rsp)\n\t popfq\n\t" END ::"i"(Flags));
}

inline void segments() {
  asm volatile(
      "mov $3, %%eax\n\t mov %%eax, %%gs\n\t mov $0x2b, %%eax\n\t mov %%eax, %%ds\n\t"
      "mov %%eax, %%es\n\t mov $0x5a5a5a5a5a5a, %%rax\n\t wrgsbase %%rax\n\t wrfsbase %%rax\n\t" END
:);
}

/// Far return into 32-bit code: there is no memory that it could run in.
inline void oldCode() {
  asm volatile("pushq $0x23\n\t pushq $0x1000\n\t lretq" ::: "memory");
}

/// More than the client reads, and it may come late.
inline void unsent() {
  static const std::array<char, 4 * page> bytes{"a second answer"};
  for (int i = 0; i < 8; ++i)
    static_cast<void>(!write(serviceDescriptor, bytes.data(), bytes.size()));
  _exit(0);
}

inline void muchMemory() {
  constexpr std::size_t size = std::size_t{16} << 20;
  fill(std::malloc(size), size);
  _exit(0);
}

/// Each is left in a sealed worker, in the middle of its message.
constexpr Mark marks[] = {
    {"nothing", nothing, false},
    {"static_data", staticData, false},
    {"heap", heap, false},
    {"stack", stack<Sandbox::stackLimit / 2>, false},
    {"memory_by_read", readIntoMemory, false},
    {"restartable_sequence", restartableSequence, false},
    {"general_registers", generalRegisters, false},
    {"vector_registers", vectorRegisters, false},
    {"segments_and_bases", segments, false},
    {"flags_DF_and_AC", flags<0x40400>, false},
    {"flag_NT", flags<0x4000>, false},
    {"flag_ID", flags<0x20'0000>, true},
    {"flag_TF", flags<0x100>, true},
    {"32_bit_code", oldCode, true},
    {"unread_and_unsent_bytes", unsent, false},
    // To where the kernel lets it grow at the most.
    {"grown_stack", stack<Sandbox::stackLimit - 64 * page>, true},
    {"much_memory", muchMemory, true},
};

#undef END

}  // namespace Keelgate::Test
