// SPDX-License-Identifier: Apache-2.0
/// Numbers the distinct keys of a document: equal keys have one number, so that a dictionary's
/// repeated key is found by comparing numbers.
///
/// The attacks: keys that all have one hash; and in binary, a million dictionaries that name the
/// same two strings of a megabyte, equal but for their last byte. So every string is hashed and
/// looked up once, however many dictionaries name it. A look-up compares with few others: keys that
/// find no place because of collisions stand in an ordered set. Then n keys of t bytes altogether
/// cost at most about t log n, whoever chose them.
///
/// A resource of one reading; one thread.
#pragma once

#include "plist/key_hash.h"
#include "plist/small_buffer.h"
#include "plist/store.h"

#include <cstddef>
#include <cstdint>
#include <set>
#include <span>
#include <string_view>

namespace PropertyList {

class KeyTable {
 public:
  explicit KeyTable(Store& store);

  /// Makes room for so many keys beside those that are there. To be called before they are added.
  /// Throws std::bad_alloc.
  void reserve(std::size_t more) {
    if (2 * (store_.keys.size() + more) > slots_.size()) grow(store_.keys.size() + more);
  }
  /// A key of a dictionary by its node, a string, and the digest of its text.
  struct Named {
    std::uint32_t node;
    std::uint64_t digest;
  };

  /// For `add`; no text is hashed twice. The slot where the key will be looked for is fetched
  /// meanwhile: of a large table the cache has few.
  Named named(std::uint32_t node) const noexcept {
    if (store_.nodes[node].key() != 0) return {node, 0};
    return named(node, keyDigest(store_.text(store_.nodes[node])));
  }
  Named named(std::uint32_t node, std::uint64_t digest) const noexcept {
    __builtin_prefetch(&slots_[keyHash(digest, bits_)], 1);
    return {node, digest};
  }
  /// Numbers keys of one dictionary. Returns how many come before the first that the dictionary has
  /// already: its keys are added one after the other, with those of no other dictionary between
  /// them. Throws std::bad_alloc.
  std::size_t add(std::uint32_t dictionary, std::span<const Named> keys);

 private:
  struct Less {
    using is_transparent = void;
    const Store* store;
    bool operator()(std::uint32_t left, std::uint32_t right) const noexcept;
    bool operator()(std::uint32_t left, std::string_view right) const noexcept;
    bool operator()(std::string_view left, std::uint32_t right) const noexcept;
  };

  /// 0 is vacant. A part of the digest stands beside the number, so that a key that has another is
  /// passed over without a look at it.
  struct Slot {
    std::uint32_t number;
    std::uint32_t tag;
  };

  /// The bits between those that choose the slot and the lowest, in which little of the key has a
  /// say.
  static std::uint32_t tagOf(std::uint64_t digest) noexcept {
    return static_cast<std::uint32_t>(keyHash(digest, 48));
  }
  Slot& slot(std::uint64_t digest, std::uint32_t step) noexcept {
    return slots_[(keyHash(digest, bits_) + step * (step + 1) / 2) & (slots_.size() - 1)];
  }
  std::uint32_t find(const Named& key, std::uint32_t count);
  void grow(std::size_t keys);
  void place(std::uint32_t number);

  Store& store_;
  /// Open addressing, at most half of them taken. The size is a power of two.
  SmallBuffer<Slot, 256> slots_;
  int bits_ = 6;
  /// Keys that found no slot. Empty in any message that was not made to collide, or nearly so.
  std::set<std::uint32_t, Less> colliding_;
};

}  // namespace PropertyList
