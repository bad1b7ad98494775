// SPDX-License-Identifier: Apache-2.0
/// What the kernel has had since Linux 6.7, and the system's headers may not have yet: the list of
/// the pages that a process has written, without a stop at each of them.
#pragma once

#include <linux/ioctl.h>

#include <cstdint>

namespace Keelgate::Sandbox {

/// Features of a userfaultfd: a protected page that is written is noted and let go, and pages that
/// are not there yet can be protected too.
constexpr std::uint64_t protectUnpopulated = 1U << 13;
constexpr std::uint64_t protectAsynchronously = 1U << 15;

/// A run of pages with the same answer.
struct PageRun {
  std::uint64_t begin;
  std::uint64_t end;
  std::uint64_t categories;
};

/// The argument of the scan, as the kernel takes it.
struct PageScan {
  std::uint64_t size;
  std::uint64_t flags;
  std::uint64_t start;
  std::uint64_t end;
  std::uint64_t walkEnd;
  std::uint64_t runs;
  std::uint64_t runCount;
  std::uint64_t maximumPages;
  std::uint64_t invertedCategories;
  std::uint64_t allOf;
  std::uint64_t anyOf;
  std::uint64_t reported;
};
static_assert(sizeof(PageScan) == 96);

constexpr unsigned long scanPages = _IOWR('f', 16, PageScan);
/// Protects what it reports.
constexpr std::uint64_t scanProtecting = 1;
constexpr std::uint64_t pageIsWritten = 1U << 1;
constexpr std::uint64_t pageIsPresent = 1U << 3;
constexpr std::uint64_t pageIsSwapped = 1U << 4;

}  // namespace Keelgate::Sandbox
