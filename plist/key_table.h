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

#include <array>
#include <cstddef>
#include <cstdint>
#include <set>
#include <string_view>

namespace PropertyList {

class KeyTable {
 public:
  explicit KeyTable(Store& store);

  /// The keys of one dictionary come one after the other, with those of no other dictionary between
  /// them: begin, add for each, end. The last two throw MalformedDocument for the first key that
  /// the dictionary has already, and std::bad_alloc.
  void begin(std::uint32_t dictionary, std::size_t keys) noexcept {
    dictionary_ = dictionary + 1;
    most_ = store_.keys.size() + keys;
  }
  /// A key with its node, a string, the digest of its text, and where the error says that it
  /// stands.
  [[gnu::always_inline]] void add(std::uint32_t node, std::uint64_t digest, std::size_t position) {
    Node& key = store_.nodes[node];
    const std::size_t known = known_.find(digest, [&] { return store_.text(key); });
    if (known == KnownKeys::none) {
      return addOther({digest, node, static_cast<std::uint32_t>(position)});
    }
    const auto number = static_cast<std::uint32_t>(known + 1);
    key.setKey(number);
    note(number, position);
  }
  /// A key that may have been met before: no text that has a number is hashed again.
  void add(std::uint32_t node, std::size_t position) {
    const Node& key = store_.nodes[node];
    if (key.key() == 0) return add(node, keyDigest(store_.text(key)), position);
    // One of those that wait may be the same.
    addWaiting();
    note(key.key(), position);
  }
  void end() { addWaiting(); }

 private:
  /// A key that is not known.
  struct Other {
    std::uint64_t digest;
    std::uint32_t node;
    std::uint32_t position;
  };

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
  [[gnu::always_inline]] void note(std::uint32_t number, std::size_t position) {
    std::uint32_t& last = last_[number - 1];
    if (last == dictionary_) refuse(position);
    last = dictionary_;
  }
  [[gnu::always_inline]] void addOther(const Other& key) {
    // Of a large table the cache has few.
    __builtin_prefetch(slots_.data() + keyHash(key.digest, bits_), 1);
    waiting_.data()[waitingCount_++] = key;
    if (waitingCount_ == waiting_.size()) addWaiting();
  }
  void addWaiting();
  [[noreturn]] void refuse(std::size_t position);
  std::uint32_t number(const Other& key);
  std::uint32_t find(const Other& key, std::uint32_t next);
  void grow(std::size_t keys);
  void place(std::uint32_t number);
  std::string_view text(std::uint32_t number) const noexcept {
    return store_.text(store_.nodes[store_.otherKey(number).node]);
  }

  Store& store_;
  const KnownKeys known_;
  /// The one at hand, counted from 1, and how many keys that are not known there may be with it.
  std::uint32_t dictionary_ = 0;
  std::size_t most_ = 0;
  /// Keys that are not known are looked up some at a time, so that the memory of many look-ups is
  /// fetched at once: one after the other, a million keys would wait a million times.
  std::array<Other, 16> waiting_;
  std::size_t waitingCount_ = 0;
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
