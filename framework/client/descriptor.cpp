// SPDX-License-Identifier: Apache-2.0
#include "framework/client/descriptor.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <new>

namespace Keelgate {

namespace {

constexpr int none = -1;

/// Behind the standard descriptors.
constexpr int lowest = 3;

int raised(int descriptor) noexcept {
  if (descriptor < 0 || descriptor >= lowest) return descriptor;
  const int higher = fcntl(descriptor, F_DUPFD_CLOEXEC, lowest);
  const int error = errno;
  close(descriptor);
  errno = error;
  return higher;
}

std::size_t pageSize() noexcept {
  return static_cast<std::size_t>(sysconf(_SC_PAGESIZE));
}

}  // namespace

DescriptorRegistry::DescriptorRegistry(std::size_t capacity) : entries_(capacity) {
  for (std::atomic<int>& entry : entries_) entry = none;
}

// Looked at before it is tried: the first entries are taken as a rule, and a failed exchange is
// dear.
std::atomic<int>* DescriptorRegistry::enter(int descriptor) noexcept {
  for (std::atomic<int>& entry : entries_) {
    int expected = none;
    if (entry.load(std::memory_order_relaxed) == none &&
        entry.compare_exchange_strong(expected, descriptor)) {
      return &entry;
    }
  }
  return nullptr;
}

void DescriptorRegistry::closeAll() noexcept {
  for (std::atomic<int>& entry : entries_) {
    // Exchanged, so that each is closed once even if two threads of the child do this.
    ::close(entry.exchange(none));
  }
}

Descriptor::Descriptor(DescriptorRegistry& registry, int descriptor) noexcept
    : descriptor_(raised(descriptor)),
      entry_(descriptor_ < 0 ? nullptr : registry.enter(descriptor_)) {}

void Descriptor::close() noexcept {
  // Struck off first: a child that is forked between the two steps keeps a copy too many, but
  // never closes a number that the application has meanwhile been given for a file of its own.
  if (entry_ != nullptr) entry_->store(none);
  entry_ = nullptr;
  if (descriptor_ >= 0) ::close(std::exchange(descriptor_, none));
}

ForkMark::ForkMark() noexcept : owner_(getpid()) {
  void* const page =
      mmap(nullptr, pageSize(), PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (page == MAP_FAILED) return;
  if (madvise(page, pageSize(), MADV_WIPEONFORK) != 0) {
    munmap(page, pageSize());
    return;
  }
  page_ = new (page) std::atomic<bool>(true);
}

ForkMark::~ForkMark() {
  if (page_ != nullptr) munmap(page_, pageSize());
}

bool ForkMark::isOurs() const noexcept {
  return page_ != nullptr ? page_->load(std::memory_order_relaxed) : getpid() == owner_;
}

}  // namespace Keelgate
