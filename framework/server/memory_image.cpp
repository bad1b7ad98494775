// SPDX-License-Identifier: Apache-2.0
#include "framework/server/memory_image.h"

#include "framework/sandbox/limits.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <array>

namespace Keelgate {

using Sandbox::PageRun;
using Sandbox::WritableArea;

namespace {

constexpr std::uint64_t pageSize = 4096;

/// More than that is not what a message of a short one's kind does; a fork is as cheap then.
constexpr std::uint64_t maximumPages = 384;

/// As many runs as one message may leave; more than that is unusual enough.
constexpr std::size_t maximumRuns = 512;

constexpr std::array<std::byte, pageSize> zeros{};

/// From where the stack may grow to, so that it shows.
WritableArea wholeStack(const WritableArea& stack) {
  return {.begin = std::min(stack.begin, stack.end - Sandbox::stackLimit), .end = stack.end};
}

/// Null where there is none to be had.
UnsharedMemory unsharedMemory(std::size_t size) noexcept {
  void* const from =
      mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (from == MAP_FAILED) return {};
  UnsharedMemory memory(static_cast<std::byte*>(from), {.size = size});
  if (madvise(from, size, MADV_DONTFORK) != 0) return {};
  return memory;
}

}  // namespace

bool MemoryImage::take(const WorkerFiles& files) {
  runs_ = unsharedMemory(maximumRuns * sizeof(PageRun));
  if (!runs_) return false;
  std::size_t offset = 0;
  for (std::size_t i = 0; i < files.areas.count; ++i) {
    const auto runs = scan(files, files.areas.areas[i], Sandbox::scanProtecting);
    if (!runs) return false;
    for (const PageRun& run : *runs) {
      pieces_.push_back({.begin = run.begin, .end = run.end, .offset = offset});
      offset += run.end - run.begin;
    }
  }
  std::sort(pieces_.begin(), pieces_.end(),
            [](const Piece& one, const Piece& other) { return one.begin < other.begin; });
  bytes_ = unsharedMemory(offset);
  return bytes_ && keep(files);
}

bool MemoryImage::keep(const WorkerFiles& files) {
  return std::all_of(pieces_.begin(), pieces_.end(), [&](const Piece& piece) {
    const std::size_t size = piece.end - piece.begin;
    return pread(files.memory.get(), bytes_.get() + piece.offset, size,
                 static_cast<off_t>(piece.begin)) == static_cast<ssize_t>(size);
  });
}

Optional<std::span<const PageRun>> MemoryImage::scan(const WorkerFiles& files,
                                                     const WritableArea& area,
                                                     std::uint64_t flags) const {
  Sandbox::PageScan order{.size = sizeof order,
                          .flags = flags,
                          .start = area.begin,
                          .end = area.end,
                          .walkEnd = 0,
                          .runs = reinterpret_cast<std::uint64_t>(runs_.get()),
                          .runCount = maximumRuns,
                          .maximumPages = maximumPages + 1,
                          .invertedCategories = 0,
                          .allOf = Sandbox::pageIsWritten,
                          // A page that was never there counts as written, too.
                          .anyOf = Sandbox::pageIsPresent | Sandbox::pageIsSwapped,
                          .reported = Sandbox::pageIsWritten};
  const int found = ioctl(files.pages.get(), Sandbox::scanPages, &order);
  if (found < 0 || order.walkEnd != area.end) return std::nullopt;
  return std::span(reinterpret_cast<const PageRun*>(runs_.get()), static_cast<std::size_t>(found));
}

bool MemoryImage::restore(const WorkerFiles& files) {
  const WritableArea& stack = files.areas.areas[0];
  std::uint64_t restored = 0;
  for (std::size_t i = 0; i < files.areas.count; ++i) {
    const auto runs = scan(files, i == 0 ? wholeStack(stack) : files.areas.areas[i], 0);
    if (!runs) return false;
    for (const PageRun& run : *runs) {
      if (i == 0 && run.begin < stack.begin) return false;
      restored += (run.end - run.begin) / pageSize;
      if (restored > maximumPages || !restoreRun(files.memory.get(), run)) return false;
    }
  }
  return true;
}

std::vector<MemoryImage::Piece>::const_iterator MemoryImage::pieceFrom(std::uint64_t page) const {
  return std::upper_bound(pieces_.begin(), pieces_.end(), page,
                          [](std::uint64_t at, const Piece& piece) { return at < piece.end; });
}

bool MemoryImage::restoreRun(int memory, const PageRun& run) const {
  for (std::uint64_t at = run.begin; at < run.end;) {
    const auto piece = pieceFrom(at);
    std::uint64_t end = run.end;
    const std::byte* from = zeros.data();
    if (piece != pieces_.end() && piece->begin <= at) {
      end = std::min(end, piece->end);
      from = bytes_.get() + piece->offset + (at - piece->begin);
    } else {
      // A page that was not there: it reads as zeros.
      if (piece != pieces_.end()) end = std::min(end, piece->begin);
      end = std::min<std::uint64_t>(end, at + zeros.size());
    }
    const auto size = static_cast<ssize_t>(end - at);
    if (pwrite(memory, from, end - at, static_cast<off_t>(at)) != size) return false;
    at = end;
  }
  return true;
}

}  // namespace Keelgate
