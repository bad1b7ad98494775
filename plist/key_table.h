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

  /// A key of a dictionary by its node, a string, with its number or, before it has one, the digest
  /// of its text.
  struct Named {
    std::uint32_t node;
    std::uint32_t number;
    std::uint64_t digest;
  };

  /// For `add`; no text is hashed twice. The slot where a key that is not known will be looked for
  /// is fetched meanwhile: of a large table the cache has few.
  Named named(std::uint32_t node) noexcept {
    const Node& key = store_.nodes[node];
    if (key.key() != 0) return {node, key.key(), 0};
    return named(node, keyDigest(store_.text(key)));
  }
  Named named(std::uint32_t node, std::uint64_t digest) noexcept {
    Node& key = store_.nodes[node];
    const std::size_t known = known_.find(digest, [&] { return store_.text(key); });
    if (known != KnownKeys::none) {
      key.setKey(static_cast<std::uint32_t>(known + 1));
      return {node, key.key(), 0};
    }
    __builtin_prefetch(slots_.data() + keyHash(digest, bits_), 1);
    return {node, 0, digest};
  }
  /// Numbers keys of one dictionary, of which `left` are still to come with these. Returns how many
  /// come before the first that the dictionary has already: its keys are added one after the other,
  /// with those of no other dictionary between them. Throws std::bad_alloc.
  std::size_t add(std::uint32_t dictionary, std::span<const Named> keys, std::size_t left);

 private:
  struct Less {
    using is_transparent = void;
    const KeyTable* table;
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
  std::uint32_t number(const Named& key, std::size_t left);
  std::uint32_t find(const Named& key, std::uint32_t next);
  void grow(std::size_t keys);
  void place(std::uint32_t number);
  std::string_view text(std::uint32_t number) const noexcept {
    return store_.text(store_.nodes[store_.otherKey(number).node]);
  }

  Store& store_;
  const KnownKeys known_;
  /// The last dictionary that has the key with this number, both counted from 1; 0 for none.
  SmallBuffer<std::uint32_t, 512> last_;
  /// Of the keys that are not known. Open addressing, at most half of them taken; a power of two,
  /// or none before there is such a key.
  SmallBuffer<Slot, 256> slots_;
  int bits_ = 1;
  /// Keys that found no slot. Empty in any message that was not made to collide, or nearly so.
  std::set<std::uint32_t, Less> colliding_;
};

}  // namespace PropertyList
