// SPDX-License-Identifier: Apache-2.0
/// The memory of a worker as it was before its first message, and the way back to it.
///
/// The kernel notes which pages are written, from the moment at which the image is taken. Pages
/// that have been restored count as written from then on: the next message is likely to write them
/// again, and a copy is cheaper than a fault that tells of it. So what is restored is always a
/// superset of what was written.
#pragma once

#include "framework/sandbox/page_scan.h"
#include "framework/sandbox/rewinding.h"
#include "framework/server/file.h"

#include <keelgate/values.h>

#include <sys/mman.h>

#include <cstddef>
#include <cstdint>
#include <span>
#include <utility>
#include <vector>

namespace Keelgate {

/// What a worker has handed over.
struct WorkerFiles {
  File tracking;
  File memory;
  File pages;
  File notices;
  Sandbox::WorkerAreas areas;
};

/// Memory that no fork gets a copy of: the next worker's image would hold the one before it, too.
/// Nothing where there is none to be had.
class UnsharedMemory {
 public:
  UnsharedMemory() noexcept = default;
  explicit UnsharedMemory(std::size_t size) noexcept;
  UnsharedMemory(UnsharedMemory&& other) noexcept : bytes_(std::exchange(other.bytes_, {})) {}
  UnsharedMemory& operator=(UnsharedMemory&& other) noexcept {
    std::swap(bytes_, other.bytes_);
    return *this;
  }
  ~UnsharedMemory() {
    if (!bytes_.empty()) munmap(bytes_.data(), bytes_.size());
  }

  [[nodiscard]] std::byte* at(std::size_t offset) const noexcept { return bytes_.data() + offset; }
  [[nodiscard]] std::size_t size() const noexcept { return bytes_.size(); }

 private:
  std::span<std::byte> bytes_;
};

/// For one thread.
class MemoryImage {
 public:
  /// Of a worker that is stopped; once. False where the kernel cannot do it, or the worker has more
  /// memory than is worth it.
  bool take(const WorkerFiles& files);

  /// Restores every page that has been written. False when they are too many, or where the stack
  /// has grown: then the worker is to be thrown away.
  bool restore(const WorkerFiles& files);

 private:
  /// Pages that follow each other, in the worker and in `bytes_`.
  struct Piece {
    std::uint64_t begin;
    std::uint64_t end;
    std::size_t offset;
  };

  /// The runs of written pages of an area; nothing when it fails, or there are too many.
  [[nodiscard]] Optional<std::span<const Sandbox::PageRun>> scan(const WorkerFiles& files,
                                                                 const Sandbox::WritableArea& area,
                                                                 std::uint64_t flags) const;
  bool keep(const WorkerFiles& files);
  bool restoreRun(int memory, const Sandbox::PageRun& run) const;
  /// The piece that has this page or the first one behind it, if any.
  [[nodiscard]] std::vector<Piece>::const_iterator pieceFrom(std::uint64_t page) const;

  std::vector<Piece> pieces_;
  /// What the kernel lists its answers in.
  UnsharedMemory runs_;
  UnsharedMemory bytes_;
};

}  // namespace Keelgate
