// SPDX-License-Identifier: Apache-2.0
/// The objects of a binary message: which is meant by a reference, and where it begins.
#pragma once

#include "plist/cursor.h"
#include "plist/key_hash.h"
#include "plist/store.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace PropertyList {

/// What a binary message begins with.
inline constexpr std::string_view magic = "bplist00";

/// What a first byte says of an object that is read at one glance. Numbers are left where they
/// stand until somebody asks for them: most of the work is then done where fields of one type
/// follow one another.
struct Glance {
  /// Null for any other object.
  Type type = Type::null;
  /// How many bytes it has.
  std::uint8_t length = 0;
  /// Ones where that many follow as an integer of one byte says.
  std::uint8_t follows = 0;
  /// Ones where its bytes are claimed, and where they have to be ASCII.
  std::uint8_t claims = 0;
  std::uint8_t ascii = 0;
};

inline constexpr auto glances = [] {
  constexpr std::uint8_t ones = 0xff;
  std::array<Glance, 256> all{};
  all[0x10] = {.type = Type::integer, .length = 1};
  all[0x11] = {.type = Type::integer, .length = 2};
  all[0x12] = {.type = Type::integer, .length = 4};
  all[0x13] = {.type = Type::integer, .length = 8};
  all[0x23] = {.type = Type::real, .length = 8};
  for (std::uint8_t i = 0; i < 0xf; ++i) {
    all[0x40U + i] = {.type = Type::data, .length = i, .claims = ones};
    all[0x50U + i] = {.type = Type::string, .length = i, .claims = ones, .ascii = ones};
  }
  all[0x4f] = {.type = Type::data, .follows = ones, .claims = ones};
  all[0x5f] = {.type = Type::string, .follows = ones, .claims = ones, .ascii = ones};
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
  /// Reads one of the commonest objects. False for any other, and for what is wrong with one. There
  /// are few branches that could not be foreseen: what does not apply is computed, and masked.
  [[gnu::always_inline]] bool readShort(std::size_t offset, std::uint64_t& claimable,
                                        Node& node) const noexcept {
    const auto byte = [this](std::size_t at) {
      return std::to_integer<std::uint32_t>(message.data()[at]);
    };
    const Glance& form = glances.data()[byte(offset)];
    const std::uint32_t follows = form.follows;
    const std::uint32_t length = form.length | (byte(offset + 2) & follows);
    const std::size_t start = offset + 1 + (follows & 2);
    const std::uint32_t claimed = length & form.claims;
    if (form.type == Type::null || start + length > tableStart || claimed > claimable) return false;
    const std::uint32_t otherCount = (byte(offset + 1) ^ 0x10) & follows;
    if ((Cursor::highBitsAt(message, start, length & form.ascii) | otherCount) != 0) return false;
    claimable -= claimed;
    node = {.bits = start, .count = length, .type = form.type, .flags = Node::read};
    return true;
  }
};

}  // namespace PropertyList
