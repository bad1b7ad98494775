// SPDX-License-Identifier: Apache-2.0
/// The memory of a worker as it was before its first message, and the way back to it.
///
/// The kernel notes which pages are written, from the moment at which the image is taken. Pages
/// that have been put back count as written from then on: the next message is likely to write them
/// again, and a copy is cheaper than a fault that tells of it. So what is put back is always a
/// superset of what was written.
#pragma once

#include "bench/rewind/file.h"
#include "bench/rewind/kernel.h"

#include <sys/mman.h>

#include <cstddef>
#include <cstdint>
#include <span>
#include <utility>
#include <vector>

namespace Keelgate::Rewind {

constexpr std::uint64_t pageSize = 4096;

/// The three files of a process, opened while it allows it: they go on to work when it does not
/// allow it any more.
struct MemoryFiles {
  File tracking;
  File memory;
  File pages;
  File mappings;
};

struct Mapping {
  std::uint64_t begin;
  std::uint64_t end;
  bool writable;
  bool isStack;
  bool ofFile;
  /// The time, as the kernel itself provides it, and the code for it.
  bool isKernels;
};

/// What /proc/PID/maps says.
std::vector<Mapping> readMappings(int file);

/// Bytes that no fork gets a copy of: the next worker's image would hold those before it, too.
class UnsharedBytes {
 public:
  /// Throws std::system_error.
  explicit UnsharedBytes(std::size_t size);
  UnsharedBytes(UnsharedBytes&& other) noexcept : bytes_(std::exchange(other.bytes_, {})) {}
  UnsharedBytes& operator=(UnsharedBytes&& other) noexcept {
    std::swap(bytes_, other.bytes_);
    return *this;
  }
  ~UnsharedBytes() {
    if (!bytes_.empty()) munmap(bytes_.data(), bytes_.size());
  }

  [[nodiscard]] std::byte* at(std::size_t offset) const noexcept { return bytes_.data() + offset; }

 private:
  std::span<std::byte> bytes_;
};

/// For one thread.
class MemoryImage {
 public:
  /// Of a process that is stopped. Throws std::system_error.
  explicit MemoryImage(MemoryFiles files);

  /// Puts back every page that has been written. False when they are more than `mostPages`, or
  /// where the stack has grown: then the process is to be thrown away.
  bool restore(std::size_t mostPages);

  /// How many pages the last restore has put back.
  [[nodiscard]] std::size_t restored() const noexcept { return restored_; }
  [[nodiscard]] int memory() const noexcept { return files_.memory.get(); }

 private:
  /// Pages that follow each other, in the process and in `bytes_`.
  struct Piece {
    std::uint64_t begin;
    std::uint64_t end;
    std::size_t offset;
  };

  void track(const Mapping& mapping);
  /// Copies the runs of `runs_`.
  void keep();
  /// Appends the runs of written pages to `runs_`. False when it fails, or there are too many.
  bool scan(const Mapping& area, std::uint64_t flags, std::size_t mostPages);
  bool restoreRun(const PageRun& run) const;
  /// The piece that has this page or the first one behind it, if any.
  [[nodiscard]] std::vector<Piece>::const_iterator pieceFrom(std::uint64_t page) const;

  MemoryFiles files_;
  /// What is tracked, neighbours in one.
  std::vector<Mapping> areas_;
  std::vector<Piece> pieces_;
  UnsharedBytes bytes_{0};
  std::vector<PageRun> runs_;
  std::uint64_t stackBegin_ = 0;
  std::size_t restored_ = 0;
};

}  // namespace Keelgate::Rewind
