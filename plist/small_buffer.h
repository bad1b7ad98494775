// SPDX-License-Identifier: Apache-2.0
/// A growing array of plain values whose first N live inside it.
///
/// Most messages have a few dozen objects: their whole document then costs no allocation. It grows
/// with realloc and leaves new elements unset, neither of which std::vector does.
///
/// A resource, tied to its place: neither copied nor moved. One thread at a time.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <new>
#include <span>
#include <type_traits>

namespace PropertyList {

template <typename T, std::size_t N>
class SmallBuffer {
  static_assert(std::is_trivially_copyable_v<T> && std::is_trivially_destructible_v<T>);

 public:
  SmallBuffer() noexcept = default;
  SmallBuffer(const SmallBuffer&) = delete;
  SmallBuffer& operator=(const SmallBuffer&) = delete;
  ~SmallBuffer() { std::free(heap_); }

  std::size_t size() const noexcept { return size_; }
  std::size_t capacity() const noexcept { return capacity_; }
  T* data() noexcept { return data_; }
  const T* data() const noexcept { return data_; }
  // The index must be below size().
  T& operator[](std::size_t index) noexcept { return data_[index]; }
  const T& operator[](std::size_t index) const noexcept { return data_[index]; }
  std::span<T> all() noexcept { return {data_, size_}; }

  // Each of the following throws std::bad_alloc and then leaves the elements as they were.
  void push(T value) {
    // A copy is pushed: a reference to an element would dangle when the buffer moves.
    if (size_ == capacity_) reserve(2 * capacity_);
    data_[size_++] = value;
  }
  void append(const T* values, std::size_t count) {
    const std::size_t start = size_;
    resize(size_ + count);
    if (count > 0) std::memcpy(data_ + start, values, count * sizeof(T));
  }
  // Elements beyond the old size are unset. At least doubled, so that many small steps cost no more
  // than one large one.
  void resize(std::size_t size) {
    if (size > capacity_) reserve(std::max(size, 2 * capacity_));
    size_ = size;
  }
  // Exactly so much: for who knows how much comes.
  void reserve(std::size_t capacity) {
    if (capacity > capacity_) grow(capacity);
  }
  // `size` elements of zero bytes, in place of what was there.
  void zero(std::size_t size) {
    size_ = 0;
    if (size > capacity_) reserve(size);
    std::memset(static_cast<void*>(data_), 0, size * sizeof(T));
    size_ = size;
  }
  void clear() noexcept { size_ = 0; }

 private:
  // Apart, so that what appends stays small enough to be inlined.
  [[gnu::noinline]] void grow(std::size_t capacity) {
    // The product would wrap, and a small block be taken for a vast one.
    if (capacity > static_cast<std::size_t>(-1) / sizeof(T)) throw std::bad_alloc();
    // Null at first, so that the first growth is an allocation and the inline elements are copied.
    void* const grown = std::realloc(heap_, capacity * sizeof(T));
    if (grown == nullptr) throw std::bad_alloc();
    if (heap_ == nullptr) std::memcpy(grown, inline_, size_ * sizeof(T));
    heap_ = grown;
    data_ = static_cast<T*>(grown);
    capacity_ = capacity;
  }

  // Unset until used: clearing 2 KiB would cost more than reading a small message.
  alignas(T) std::byte inline_[N * sizeof(T)];
  // Null as long as the elements are inline; data_ points at whichever holds them.
  void* heap_ = nullptr;
  T* data_ = reinterpret_cast<T*>(inline_);
  std::size_t size_ = 0;
  std::size_t capacity_ = N;
};

}  // namespace PropertyList
