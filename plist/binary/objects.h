// SPDX-License-Identifier: Apache-2.0
/// The objects of a binary message: which is meant by a reference, and where it begins.
#pragma once

#include "plist/cursor.h"
#include "plist/key_hash.h"
#include "plist/store.h"

#include <array>
#include <bit>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace PropertyList {

/// What a binary message begins with.
inline constexpr std::string_view magic = "bplist00";

/// What a first byte says of an object that has no length: its type, how many bytes follow, and the
/// bits of its value that stand in none of them. Null where it says something else.
struct Fixed {
  Type type = Type::null;
  std::uint8_t width = 0;
  std::uint8_t bits = 0;
  bool isSigned = false;
};

inline constexpr auto fixedObjects = [] {
  std::array<Fixed, 256> all{};
  all[0x08] = {.type = Type::boolean};
  all[0x09] = {.type = Type::boolean, .bits = 1};
  all[0x10] = {.type = Type::integer, .width = 1};
  all[0x11] = {.type = Type::integer, .width = 2};
  all[0x12] = {.type = Type::integer, .width = 4};
  all[0x13] = {.type = Type::integer, .width = 8, .isSigned = true};
  all[0x23] = {.type = Type::real, .width = 8};
  all[0x33] = {.type = Type::date, .width = 8};
  return all;
}();

/// Where the objects stand, and their nodes. Borrowed. A loop takes a copy: what it writes to nodes
/// cannot change the copy, so that all of it stays in registers.
struct Objects {
  Bytes message;
  std::size_t offsetSize = 0;
  std::size_t referenceSize = 0;
  std::size_t tableStart = 0;
  Node* nodes = nullptr;
  std::size_t count = 0;

  /// The number of the object that is named at this position of the message.
  std::uint32_t reference(std::size_t position) const {
    const std::uint64_t number = Cursor::bigEndianAt(message, position, referenceSize);
    if (number >= count) throw MalformedDocument(Problem::referenceOutOfRange, position);
    return static_cast<std::uint32_t>(number);
  }
  /// Where the object of this number begins.
  std::size_t offset(std::uint32_t number) const {
    // Inside the table, since the number is below the count that the table was checked for.
    const std::size_t entry = tableStart + number * offsetSize;
    const std::uint64_t offset = Cursor::bigEndianAt(message, entry, offsetSize);
    // Below the first object it wraps.
    if (offset - magic.size() >= tableStart - magic.size()) {
      throw MalformedDocument(Problem::objectOutside, entry);
    }
    return static_cast<std::size_t>(offset);
  }
  /// Reads a text of fewer than 256 ASCII characters. Its digest, which is never 0; or 0 for any
  /// other object, and for what is wrong with one.
  [[gnu::always_inline]] std::uint64_t readKey(std::size_t offset, std::uint64_t& claimable,
                                               Node& node) const noexcept {
    const std::uint64_t object = Cursor::wordAt(message, offset);
    std::uint64_t digest = 0;
    std::uint32_t length = object & 0xf;
    std::size_t start = offset + 1;
    if ((object & 0xf8) == 0x50) {
      // All of the text is in the word.
      digest = shortKeyDigest(object);
      if ((digest & shortKeyHighBits) != 0 || start + length > tableStart) return 0;
    } else {
      if ((object & 0xf0) != 0x50) return 0;
      if (length == 0xf) {
        // The length follows, as an integer of one byte.
        if ((object & 0xff00) != 0x1000) return 0;
        length = object >> 16 & 0xff;
        start += 2;
      }
      if (length < 8 || start + length > tableStart) return 0;
      std::uint64_t seen = 0;
      digest = longKeyDigest(Cursor::textAt(message, start, length),
                             [&](std::uint64_t word) { seen |= word; });
      if ((seen & 0x8080'8080'8080'8080) != 0) return 0;
    }
    if (length > claimable) return 0;
    claimable -= length;
    node = {.bits = start, .count = length, .type = Type::string, .flags = Node::read};
    return digest;
  }
  /// Reads an object that has no length and begins with these bytes. False for any other, and for
  /// what is wrong with one.
  [[gnu::always_inline]] bool readFixed(std::uint64_t head, std::size_t offset,
                                        Node& node) const noexcept {
    const Fixed fixed = fixedObjects.data()[head >> 56];
    if (fixed.type == Type::null || offset + 1 + fixed.width > tableStart) return false;
    const std::uint64_t word = Cursor::bigEndianAt(message, offset + 1, 8);
    // Shifted in two steps: of no bytes, by all 64 bits.
    const unsigned half = 32U - 4U * fixed.width;
    const std::uint64_t bits = word >> half >> half | fixed.bits;
    if (fixed.type == Type::date && !std::isfinite(std::bit_cast<double>(bits))) return false;
    const bool isNegative = fixed.isSigned & (bits >> 63 != 0);
    node = {.bits = bits,
            .type = fixed.type,
            .flags = static_cast<std::uint8_t>(Node::read | (isNegative ? Node::negative : 0))};
    return true;
  }
};

}  // namespace PropertyList
