// SPDX-License-Identifier: Apache-2.0
/// A descriptor that is closed with its owner. For one thread.
#pragma once

#include <unistd.h>

#include <utility>

namespace Keelgate {

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

}  // namespace Keelgate
