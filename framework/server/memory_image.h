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

#include <keelgate/values.h>

#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <utility>
#include <vector>

namespace Keelgate {

/// A descriptor that is closed with its owner. For one thread.
class File {
 public:
  explicit File(int descriptor = -1) noexcept : descriptor_(descriptor) {}
  File(File&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}
  File& operator=(File&& other) noexcept {
    std::swap(descriptor_, other.descriptor_);
    return *this;
  }
  ~File() {
    if (descriptor_ >= 0) close(descriptor_);
  }

  [[nodiscard]] int get() const noexcept { return descriptor_; }
  explicit operator bool() const noexcept { return descriptor_ >= 0; }

 private:
  int descriptor_;
};

/// What a worker has handed over.
struct WorkerFiles {
  File tracking;
  File memory;
  File pages;
  File notices;
  Sandbox::WorkerAreas areas;
};

struct Unmap {
  std::size_t size = 0;
  void operator()(std::byte* bytes) const noexcept { munmap(bytes, size); }
};
/// Memory that no fork gets a copy of: the next worker's image would hold the one before it, too.
using UnsharedMemory = std::unique_ptr<std::byte[], Unmap>;

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
