// SPDX-License-Identifier: Apache-2.0
/// From a wire key to the position of its field, through a table made at compile time.
///
/// Open addressing over the schema's own keys, at most a quarter full. A message cannot add to the
/// table: whatever keys it brings, a look-up compares with no more of them than the longest run of
/// neighbours, which stands when the program is built.
#pragma once

#include "plist/key_hash.h"

#include <keelgate/describe.h>

#include <algorithm>
#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace VespKeelgateService {

/// Made by the compiler; constants, usable from any thread.
template <Keelgate::Schema S>
class KeyTable {
  static constexpr std::size_t count = S::CodingKeys::size;
  // At most a quarter of a power of two.
  static constexpr int bits = std::bit_width(4 * count);
  // No schema has so many fields.
  static constexpr std::uint16_t vacant = 0xffff;

  static constexpr auto digests = [] {
    std::array<std::uint64_t, count> all{};
    for (std::size_t i = 0; i < count; ++i)
      all[i] = PropertyList::keyDigest(S::CodingKeys::keys[i]);
    return all;
  }();

  static constexpr std::size_t capacity = std::size_t{1} << bits;
  static constexpr auto slots = [] {
    std::array<std::uint16_t, capacity> all{};
    all.fill(vacant);
    for (std::size_t field = 0; field < count; ++field) {
      std::size_t at = PropertyList::keyHash(digests[field], bits);
      while (all[at] != vacant) at = (at + 1) % capacity;
      all[at] = static_cast<std::uint16_t>(field);
    }
    return all;
  }();

  static consteval bool keysAreDistinct() {
    auto sorted = S::CodingKeys::keys;
    std::sort(sorted.begin(), sorted.end());
    return std::adjacent_find(sorted.begin(), sorted.end()) == sorted.end();
  }
  static_assert(S::CodingKeys::isComplete(), "a member of the schema is not in its list of fields");
  static_assert(keysAreDistinct(), "two fields of a schema travel under one wire key");

 public:
  static constexpr std::size_t none = vacant;

  /// The position of the field that travels under the key with this digest, or `none`. `key()` is
  /// asked for the key's text only where another key may have its digest.
  template <class Key>
  static constexpr std::size_t find(std::uint64_t digest, Key&& key) {
    // Ends: at least three slots in four are vacant.
    for (std::size_t at = PropertyList::keyHash(digest, bits);; at = (at + 1) % capacity) {
      const std::uint16_t field = slots[at];
      if (field == vacant ||
          (digests.data()[field] == digest &&
           (PropertyList::isWholeKey(digest) || S::CodingKeys::keys[field] == key()))) {
        return field;
      }
    }
  }
};

}  // namespace VespKeelgateService
