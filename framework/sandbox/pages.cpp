// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/steps.h"

#include <link.h>
#include <array>
#include <cstddef>
#include <cstdlib>

namespace Keelgate::Sandbox {

namespace {

constexpr std::size_t page = 4096;

/// The kernel maps so much of a file at a fault in it, as far as it has it in memory.
constexpr std::size_t faultAround = 16 * page;

/// What a message of a few hundred bytes needs; more for all would cost more than it saves.
constexpr std::size_t stackPages = 6;
constexpr std::size_t heapPages = 4;

int readProgram(dl_phdr_info* info, std::size_t, void*) {
  for (std::size_t i = 0; i < info->dlpi_phnum; ++i) {
    const ElfW(Phdr)& segment = info->dlpi_phdr[i];
    if (segment.p_type != PT_LOAD || (segment.p_flags & PF_W) != 0) continue;
    const auto* const start =
        reinterpret_cast<const volatile std::byte*>(info->dlpi_addr + segment.p_vaddr);
    for (std::size_t at = 0; at < segment.p_memsz; at += faultAround) {
      static_cast<void>(start[at]);
    }
  }
  // The program comes first, and there is nothing else.
  return 1;
}

/// Not read first: that would be a fault of its own, for a page of zeros that is shared.
void write(volatile std::byte* from, std::size_t size) {
  for (std::size_t at = 0; at < size; at += page) from[at] = std::byte{};
}

}  // namespace

void touchPages() noexcept {
  dl_iterate_phdr(readProgram, nullptr);
  std::array<std::byte, stackPages * page> stack;
  write(stack.data(), stack.size());
  if (auto* const heap = static_cast<std::byte*>(std::malloc(heapPages * page))) {
    write(heap, heapPages * page);
    std::free(heap);
  }
}

}  // namespace Keelgate::Sandbox
