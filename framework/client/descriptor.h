// SPDX-License-Identifier: Apache-2.0
/// Descriptors with an owner, all of them registered.
///
/// The registry is for an application that forks: whatever its other threads were doing at that
/// moment, the child can close what it inherited. A worker does not see the end of its channel as
/// long as a forgotten copy is open in some child.
#pragma once

#include <atomic>
#include <cstddef>
#include <utility>
#include <vector>

namespace Keelgate {

/// The open descriptors of one client. Entries are atomic and never move, and no lock is held on
/// them, so that they can be read after a fork; all members may be called from any thread.
class DescriptorRegistry {
 public:
  /// Room for so many; what is opened beyond it works, but stays open in a forked child.
  explicit DescriptorRegistry(std::size_t capacity);

  /// In a forked child: closes the child's copies. Their owners must never run again. Nothing but
  /// system calls and atomics: after a fork there may be a lock that nobody will release, also
  /// inside the C library.
  void closeAll() noexcept;

 private:
  friend class Descriptor;
  std::atomic<int>* enter(int descriptor) noexcept;

  /// Its size never changes. -1 where nothing is entered.
  std::vector<std::atomic<int>> entries_;
};

/// Owns a descriptor, or none. One thread at a time.
class Descriptor {
 public:
  Descriptor() = default;
  /// Takes what a system call returned; with a negative number it owns none, and errno is kept.
  /// A number from 0 to 2 is replaced: an application that has closed its standard descriptors may
  /// still write to them.
  Descriptor(DescriptorRegistry& registry, int descriptor) noexcept;
  Descriptor(Descriptor&& other) noexcept
      : descriptor_(std::exchange(other.descriptor_, -1)),
        entry_(std::exchange(other.entry_, nullptr)) {}
  Descriptor& operator=(Descriptor&& other) noexcept {
    std::swap(descriptor_, other.descriptor_);
    std::swap(entry_, other.entry_);
    return *this;
  }
  ~Descriptor() { close(); }

  /// Does nothing where there is none.
  void close() noexcept;
  [[nodiscard]] int get() const noexcept { return descriptor_; }
  explicit operator bool() const noexcept { return descriptor_ >= 0; }

 private:
  /// Entry and descriptor go together: none has one without the other, but for a full registry.
  int descriptor_ = -1;
  std::atomic<int>* entry_ = nullptr;
};

/// Which process a thing belongs to. A fork is told apart by a page that the kernel wipes in it: a
/// process number may be the same in another process namespace. All members may be called from any
/// thread and in a fork.
class ForkMark {
 public:
  ForkMark() noexcept;
  ~ForkMark();
  ForkMark(const ForkMark&) = delete;
  ForkMark& operator=(const ForkMark&) = delete;

  /// Whether this is the process that made it.
  [[nodiscard]] bool isOurs() const noexcept;

 private:
  /// Null where the kernel cannot wipe pages: then the number has to do.
  std::atomic<bool>* page_ = nullptr;
  const int owner_;
};

}  // namespace Keelgate
