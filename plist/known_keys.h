// SPDX-License-Identifier: Apache-2.0
/// Keys that a reader is told of beforehand, as the fields of a schema are, with a table of them
/// that is made at compile time. One look-up then tells both which field a key is and whether its
/// dictionary has had it.
///
/// A message cannot add to the table: whatever keys it brings, a look-up compares with no more of
/// them than the longest run of neighbours, which stands when the program is built.
///
/// A view of constants; usable from any thread.
#pragma once

#include "plist/key_hash.h"

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace PropertyList {

struct KnownKeys {
  const std::string_view* texts;
  /// Which text is that of the key at a position.
  const std::uint16_t* order;
  const std::uint64_t* digests;
  /// Open addressing with 2^bits slots: the position of a key, or `none`.
  const std::uint16_t* slots;
  int bits;
  std::uint32_t count;

  /// No table has so many keys.
  static constexpr std::uint16_t none = 0xffff;

  /// The position of the key with this digest, or `none`. `text()` is asked for the key only where
  /// another one may have its digest.
  template <class Text>
  [[gnu::always_inline]] constexpr std::size_t find(std::uint64_t digest, Text&& text) const {
    // Most keys stand in the slot where they are looked for.
    const std::size_t slot = keyHash(digest, bits);
    const std::uint16_t position = slots[slot];
    if (position == none || isAt(position, digest, text)) return position;
    return findBehind(slot, digest, text);
  }

 private:
  template <class Text>
  [[gnu::always_inline]] constexpr bool isAt(std::size_t position, std::uint64_t digest,
                                             Text& text) const {
    return digests[position] == digest &&
           (isWholeKey(digest) || isSameLongKey(texts[order[position]], text()));
  }
  template <class Text>
  [[gnu::noinline]] constexpr std::size_t findBehind(std::size_t slot, std::uint64_t digest,
                                                     Text& text) const {
    // Ends: most slots are vacant.
    for (;;) {
      slot = (slot + 1) & ((std::size_t{1} << bits) - 1);
      const std::uint16_t position = slots[slot];
      if (position == none || isAt(position, digest, text)) return position;
    }
  }
};

/// The table of distinct keys in an order of theirs, to be kept as a constant beside both.
template <std::size_t count>
struct KnownKeysTable {
  using Texts = std::array<std::string_view, count>;
  using Order = std::array<std::uint16_t, count>;
  // A quarter of the slots are taken at most.
  static constexpr int bits = std::bit_width(4 * count + 1);
  std::array<std::uint64_t, count + 1> digests{};
  std::array<std::uint16_t, std::size_t{1} << bits> slots{};

  constexpr KnownKeysTable(const Texts& texts, const Order& order) {
    slots.fill(KnownKeys::none);
    for (std::size_t i = 0; i < count; ++i) {
      digests[i] = keyDigest(texts[order[i]]);
      std::size_t at = keyHash(digests[i], bits);
      while (slots[at] != KnownKeys::none) at = (at + 1) % slots.size();
      slots[at] = static_cast<std::uint16_t>(i);
    }
  }

  constexpr KnownKeys of(const Texts& texts, const Order& order) const {
    return {texts.data(), order.data(), digests.data(),
            slots.data(), bits,         static_cast<std::uint32_t>(count)};
  }
};

namespace Detail {
inline constexpr KnownKeysTable<0>::Texts noKeys{};
inline constexpr KnownKeysTable<0>::Order noOrder{};
inline constexpr KnownKeysTable<0> noKeysTable{noKeys, noOrder};
}  // namespace Detail

/// For who has no schema.
inline constexpr KnownKeys noKnownKeys = Detail::noKeysTable.of(Detail::noKeys, Detail::noOrder);

}  // namespace PropertyList
