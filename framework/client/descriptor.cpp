// SPDX-License-Identifier: Apache-2.0
#include "framework/client/descriptor.h"

#include <unistd.h>

namespace Keelgate {

namespace {
constexpr int none = -1;
}

DescriptorBook::DescriptorBook(std::size_t capacity) : entries_(capacity) {
  for (std::atomic<int>& entry : entries_) entry = none;
}

// Looked at before it is tried: the first entries are taken as a rule, and a failed exchange is
// dear.
std::atomic<int>* DescriptorBook::enter(int descriptor) noexcept {
  for (std::atomic<int>& entry : entries_) {
    int expected = none;
    if (entry.load(std::memory_order_relaxed) == none &&
        entry.compare_exchange_strong(expected, descriptor)) {
      return &entry;
    }
  }
  return nullptr;
}

void DescriptorBook::closeAll() noexcept {
  for (std::atomic<int>& entry : entries_) {
    // Exchanged, so that each is closed once even if two threads of the child do this.
    if (const int descriptor = entry.exchange(none); descriptor != none) ::close(descriptor);
  }
}

void Descriptor::close() noexcept {
  // Struck off first: a child that is forked between the two steps keeps a copy too many, but
  // never closes a number that the application has meanwhile been given for a file of its own.
  if (entry_ != nullptr) entry_->store(none);
  entry_ = nullptr;
  if (descriptor_ >= 0) ::close(std::exchange(descriptor_, none));
}

}  // namespace Keelgate
