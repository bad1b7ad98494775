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

#include "plist/small_buffer.h"
#include "plist/store.h"

#include <cstddef>
#include <cstdint>
#include <set>
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
  /// Numbers the key of a dictionary that has this node, a string. False if the dictionary has the
  /// key already: its keys are added one after the other, with those of no other dictionary
  /// between them. Throws std::bad_alloc.
  bool add(std::uint32_t dictionary, std::uint32_t node) {
    if (store_.nodes[node].key() == 0) store_.nodes[node].setKey(find(node));
    Key& key = store_.keys[store_.nodes[node].key() - 1];
    const bool isNew = key.dictionary != dictionary + 1;
    key.dictionary = dictionary + 1;
    return isNew;
  }

 private:
  struct Less {
    using is_transparent = void;
    const Store* store;
    bool operator()(std::uint32_t left, std::uint32_t right) const noexcept;
    bool operator()(std::uint32_t left, std::string_view right) const noexcept;
    bool operator()(std::string_view left, std::uint32_t right) const noexcept;
  };

  std::uint32_t find(std::uint32_t node);
  void grow(std::size_t keys);
  void place(std::uint32_t number);
  std::uint32_t& slot(std::uint64_t digest, std::uint32_t step) noexcept;

  Store& store_;
  /// Open addressing; keys' numbers, at most half of them taken. The size is a power of two.
  SmallBuffer<std::uint32_t, 512> slots_;
  int bits_ = 6;
  /// Keys that found no slot. Empty in any message that was not made to collide, or nearly so.
  std::set<std::uint32_t, Less> colliding_;
};

}  // namespace PropertyList
