// SPDX-License-Identifier: Apache-2.0
#include "bench/rewind/memory_image.h"

#include "framework/sandbox/limits.h"

#include <linux/userfaultfd.h>
#include <sys/ioctl.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <string>
#include <system_error>

namespace Keelgate::Rewind {

namespace {

[[noreturn]] void fail(const char* what) {
  throw std::system_error(errno, std::generic_category(), what);
}

std::string readText(int file) {
  std::string text;
  std::array<char, 4096> piece;
  for (ssize_t got; (got = read(file, piece.data(), piece.size())) > 0;) {
    text.append(piece.data(), static_cast<std::size_t>(got));
  }
  return text;
}

constexpr std::array<std::byte, 16 * pageSize> zeros{};

/// As many runs as one message may leave; more than that is unusual enough.
constexpr std::size_t mostRuns = 512;

}  // namespace

std::vector<Mapping> readMappings(int file) {
  std::vector<Mapping> mappings;
  const std::string text = readText(file);
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t end = std::min(text.find('\n', at), text.size());
    const std::string line = text.substr(at, end - at);
    unsigned long first = 0;
    unsigned long last = 0;
    unsigned long inode = 0;
    char rights[5] = "";
    if (std::sscanf(line.c_str(), "%lx-%lx %4s %*x %*s %lu", &first, &last, rights, &inode) != 4) {
      fail("mappings");
    }
    mappings.push_back({.begin = first,
                        .end = last,
                        .writable = rights[1] == 'w',
                        .isStack = line.ends_with("[stack]"),
                        .ofFile = inode != 0,
                        .isKernels = line.find("[v") != std::string::npos});
    at = end + 1;
  }
  return mappings;
}

UnsharedBytes::UnsharedBytes(std::size_t size) {
  if (size == 0) return;
  void* const from =
      mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (from == MAP_FAILED) fail("memory for an image");
  bytes_ = {static_cast<std::byte*>(from), size};
  if (madvise(from, size, MADV_DONTFORK) != 0) fail("memory for an image");
}

MemoryImage::MemoryImage(MemoryFiles files) : files_(std::move(files)) {
  uffdio_api api{
      .api = UFFD_API, .features = protectUnpopulated | protectAsynchronously, .ioctls = 0};
  if (ioctl(files_.tracking.get(), UFFDIO_API, &api) != 0) fail("userfaultfd");
  for (const Mapping& mapping : readMappings(files_.mappings.get())) {
    if (mapping.writable) track(mapping);
  }
  runs_.reserve(mostRuns);
  for (const Mapping& area : areas_) {
    if (!scan(area, scanProtecting, SIZE_MAX)) fail("scan of pages");
  }
  keep();
}

void MemoryImage::track(const Mapping& mapping) {
  uffdio_register area{.range = {.start = mapping.begin, .len = mapping.end - mapping.begin},
                       .mode = UFFDIO_REGISTER_MODE_WP,
                       .ioctls = 0};
  if (ioctl(files_.tracking.get(), UFFDIO_REGISTER, &area) != 0) fail("registering of memory");
  if (mapping.isStack) {
    stackBegin_ = mapping.begin;
    // From where it may grow to, so that it shows.
    areas_.push_back(mapping);
    areas_.back().begin = std::min(mapping.begin, mapping.end - Sandbox::stackLimit);
  } else if (!areas_.empty() && areas_.back().end == mapping.begin) {
    areas_.back().end = mapping.end;
  } else {
    areas_.push_back(mapping);
  }
}

void MemoryImage::keep() {
  std::size_t offset = 0;
  for (const PageRun& run : runs_) {
    pieces_.push_back({.begin = run.begin, .end = run.end, .offset = offset});
    offset += run.end - run.begin;
  }
  bytes_ = UnsharedBytes(offset);
  for (const Piece& piece : pieces_) {
    const std::size_t size = piece.end - piece.begin;
    if (pread(files_.memory.get(), bytes_.at(piece.offset), size,
              static_cast<off_t>(piece.begin)) != static_cast<ssize_t>(size)) {
      fail("reading of memory");
    }
  }
}

bool MemoryImage::scan(const Mapping& area, std::uint64_t flags, std::size_t mostPages) {
  const std::size_t before = runs_.size();
  runs_.resize(mostRuns);
  PageScan order{.size = sizeof order,
                 .flags = flags,
                 .start = area.begin,
                 .end = area.end,
                 .walkEnd = 0,
                 .runs = reinterpret_cast<std::uint64_t>(runs_.data() + before),
                 .runCount = mostRuns - before,
                 .maximumPages = mostPages == SIZE_MAX ? 0 : mostPages + 1,
                 .invertedCategories = 0,
                 .allOf = pageIsWritten,
                 // A page that was never there counts as written, too.
                 .anyOf = pageIsPresent | pageIsSwapped,
                 .reported = pageIsWritten};
  const int found = ioctl(files_.pages.get(), scanPages, &order);
  runs_.resize(before + static_cast<std::size_t>(std::max(found, 0)));
  return found >= 0 && order.walkEnd == area.end;
}

bool MemoryImage::restore(std::size_t mostPages) {
  runs_.clear();
  restored_ = 0;
  for (const Mapping& area : areas_) {
    if (!scan(area, 0, mostPages)) return false;
    for (const PageRun& run : runs_) {
      if (area.isStack && run.begin < stackBegin_) return false;
      restored_ += (run.end - run.begin) / pageSize;
      if (restored_ > mostPages || !restoreRun(run)) return false;
    }
    runs_.clear();
  }
  return true;
}

std::vector<MemoryImage::Piece>::const_iterator MemoryImage::pieceFrom(std::uint64_t page) const {
  return std::upper_bound(pieces_.begin(), pieces_.end(), page,
                          [](std::uint64_t at, const Piece& piece) { return at < piece.end; });
}

bool MemoryImage::restoreRun(const PageRun& run) const {
  for (std::uint64_t at = run.begin; at < run.end;) {
    const auto piece = pieceFrom(at);
    std::uint64_t end = run.end;
    const std::byte* from = zeros.data();
    if (piece != pieces_.end() && piece->begin <= at) {
      end = std::min(end, piece->end);
      from = bytes_.at(piece->offset + (at - piece->begin));
    } else {
      // A page that was not there: it reads as zeros.
      if (piece != pieces_.end()) end = std::min(end, piece->begin);
      end = std::min<std::uint64_t>(end, at + zeros.size());
    }
    const auto size = static_cast<ssize_t>(end - at);
    if (pwrite(files_.memory.get(), from, end - at, static_cast<off_t>(at)) != size) return false;
    at = end;
  }
  return true;
}

}  // namespace Keelgate::Rewind
