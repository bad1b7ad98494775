// SPDX-License-Identifier: Apache-2.0
#include "bench/rewind/marks.h"

#include "framework/contracts/process.h"
#include "framework/sandbox/limits.h"

#include <sys/rseq.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <ctime>

namespace Keelgate::Rewind {

namespace {

constexpr std::size_t page = 4096;
constexpr int pattern = 0x5a;

std::array<char, 3 * page> zeroed;
std::array<char, 64> initialised{"initialised"};
thread_local std::array<char, 64> ofThread{"of the thread"};

[[noreturn]] void end() {
  _exit(0);
}

void nothing() {}

void fill(void* from, std::size_t size) {
  volatile char* const bytes = static_cast<char*>(from);
  for (std::size_t at = 0; at < size; ++at) bytes[at] = pattern;
}

void staticData() {
  fill(zeroed.data(), zeroed.size());
  fill(initialised.data(), initialised.size());
  fill(ofThread.data(), ofThread.size());
  end();
}

/// The allocator's own lists too, and pages that nobody has touched before.
void heap() {
  for (int size = 16; size < 4096; size += 16) {
    void* const block = std::malloc(static_cast<std::size_t>(size));
    fill(block, static_cast<std::size_t>(size));
    if (size % 3 == 0) std::free(block);
  }
  constexpr std::size_t far = std::size_t{64} << 20;
  char* const large = static_cast<char*>(std::malloc(far));
  for (std::size_t at = 0; at < far; at += far / 64) fill(large + at, 8);
  end();
}

[[gnu::noinline]] void stackFrom(std::size_t depth) {
  volatile char* const here = static_cast<char*>(__builtin_frame_address(0));
  for (std::size_t at = page; at < depth; at += 64 * page)
    here[-static_cast<std::ptrdiff_t>(at)] = pattern;
  end();
}

void stack() {
  stackFrom(Sandbox::stackLimit / 2);
}
/// To where the kernel lets it grow at the most.
void grownStack() {
  stackFrom(Sandbox::stackLimit - 64 * page);
}

/// Written by the kernel, on the process's behalf.
void readIntoMemory() {
  char* const block = static_cast<char*>(std::malloc(16 * page));
  if (read(serviceDescriptor, block + 5 * page, page) <= 0) abort();
  end();
}

/// A critical section that is nowhere, for the kernel to jump out of at the next interruption.
void restartableSequence() {
  auto* const area = reinterpret_cast<struct rseq*>(static_cast<char*>(__builtin_thread_pointer()) +
                                                    __rseq_offset);
  // In one write, and over before it can be seen.
  volatile auto* const section = &area->rseq_cs;
  asm volatile(
      "movq $0x1000, %0\n\t"
      "mov $231, %%eax\n\t"
      "xor %%edi, %%edi\n\t"
      "syscall"
      : "=m"(*section)
      :
      : "rax", "rdi", "rcx", "r11", "memory");
}

static_assert(SYS_exit_group == 231);

void generalRegisters() {
  asm volatile(
      "mov $0x5a5a5a5a5a5a5a5a, %%rbx\n\t"
      "mov %%rbx, %%rdx\n\t mov %%rbx, %%rsi\n\t mov %%rbx, %%r8\n\t mov %%rbx, %%r9\n\t"
      "mov %%rbx, %%r10\n\t mov %%rbx, %%r12\n\t mov %%rbx, %%r13\n\t mov %%rbx, %%r14\n\t"
      "mov %%rbx, %%r15\n\t mov %%rbx, %%rbp\n\t mov %%rbx, %%rsp\n\t"
      "mov $231, %%eax\n\t xor %%edi, %%edi\n\t syscall\n\t ud2" ::
          : "memory");
}

[[gnu::target("avx512f,avx512bw")]] void widestRegisters() {
  asm volatile(
      ".irp "
      "n,0,1,2,3,4,5,6,7,8,9,10,11,12,13,14,15,16,17,18,19,20,21,22,23,24,25,26,27,28,29,30,31\n\t"
      "vpternlogd $0xff, %%zmm\\n, %%zmm\\n, %%zmm\\n\n\t"
      ".endr\n\t"
      ".irp n,0,1,2,3,4,5,6,7\n\t"
      "kxnorq %%k\\n, %%k\\n, %%k\\n\n\t"
      ".endr\n\t" ::
          : "memory");
}

void vectorRegisters() {
  static const std::uint32_t control = 0xffbf;
  static const std::uint16_t x87Control = 0x0e3f;
  if (__builtin_cpu_supports("avx512bw") != 0) {
    widestRegisters();
  } else {
    asm volatile("pcmpeqd %%xmm0, %%xmm0\n\t pcmpeqd %%xmm15, %%xmm15" ::: "memory");
  }
  asm volatile(
      "ldmxcsr %0\n\t fldcw %1\n\t fldpi\n\t fldpi\n\t fldpi\n\t"
      "mov $231, %%eax\n\t xor %%edi, %%edi\n\t syscall\n\t ud2" ::"m"(control),
      "m"(x87Control)
      : "memory");
}

template <unsigned long Flags>
void flags() {
  asm volatile(
      "pushfq\n\t orq %0, (%%rsp)\n\t popfq\n\t"
      "mov $231, %%eax\n\t mov $0, %%edi\n\t syscall\n\t ud2" ::"i"(Flags)
      : "memory");
}

void segments() {
  asm volatile(
      "mov $3, %%eax\n\t mov %%eax, %%gs\n\t mov $0x2b, %%eax\n\t mov %%eax, %%ds\n\t"
      "mov %%eax, %%es\n\t mov $0x5a5a5a5a5a5a, %%rax\n\t wrgsbase %%rax\n\t wrfsbase %%rax\n\t"
      "mov $231, %%eax\n\t xor %%edi, %%edi\n\t syscall\n\t ud2" ::
          : "memory");
}

/// Far return into 32-bit code: there is no memory that it could run in.
void oldCode() {
  asm volatile("pushq $0x23\n\t pushq $0x1000\n\t lretq" ::: "memory");
}

void fault() {
  asm volatile("movb $1, 0" ::: "memory");
}

/// More than the client reads, and it may come late.
void unsent() {
  static const std::array<char, 4 * page> bytes{"a second answer"};
  for (int i = 0; i < 8; ++i)
    static_cast<void>(!write(serviceDescriptor, bytes.data(), bytes.size()));
  end();
}

void processorTime() {
  timespec from{};
  timespec now{};
  clock_gettime(CLOCK_MONOTONIC, &from);
  do {
    clock_gettime(CLOCK_MONOTONIC, &now);
  } while ((now.tv_sec - from.tv_sec) * 1000 + (now.tv_nsec - from.tv_nsec) / 1'000'000 < 50);
  end();
}

void muchMemory() {
  constexpr std::size_t size = std::size_t{16} << 20;
  fill(std::malloc(size), size);
  end();
}

constexpr unsigned long directionAndAlignment = 0x40400;
constexpr unsigned long nestedTask = 0x4000;
constexpr unsigned long singleStep = 0x100;
constexpr unsigned long identification = 0x20'0000;

constexpr Mark all[] = {
    {"nothing", nothing, false},
    {"static data", staticData, false},
    {"heap", heap, false},
    {"stack", stack, false},
    {"memory by read", readIntoMemory, false},
    {"restartable sequence", restartableSequence, false},
    {"general registers", generalRegisters, false},
    {"vector registers", vectorRegisters, false},
    {"segments and bases", segments, false},
    {"flags DF and AC", flags<directionAndAlignment>, false},
    {"flag NT", flags<nestedTask>, false},
    {"flag ID", flags<identification>, true},
    {"flag TF", flags<singleStep>, true},
    {"32-bit code", oldCode, true},
    {"a fault", fault, true},
    {"unread and unsent bytes", unsent, false},
    {"processor time", processorTime, false},
    {"grown stack", grownStack, true},
    {"much memory", muchMemory, true},
};

}  // namespace

std::span<const Mark> marks() noexcept {
  return all;
}

}  // namespace Keelgate::Rewind
