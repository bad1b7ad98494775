// SPDX-License-Identifier: Apache-2.0
/// The digest of dictionary keys. The same at compile time, so that tables of fields can be made
/// with it: whoever looks a key up has its digest from the document.
///
/// Pure functions; may be used from any thread.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <type_traits>

namespace PropertyList {

/// Odd, and without a pattern in its bits.
inline constexpr std::uint64_t keyFactor = 0x9e37'79b9'7f4a'7c15;

/// The first bytes of the text as a number, least significant first. The text must have them.
template <std::size_t bytes>
constexpr std::uint64_t loadWord(std::string_view text) noexcept {
  std::uint64_t word = 0;
  if (std::is_constant_evaluated() || std::endian::native != std::endian::little) {
    for (std::size_t i = 0; i < bytes; ++i) {
      word |= std::uint64_t{static_cast<unsigned char>(text[i])} << (8 * i);
    }
  } else {
    std::memcpy(&word, text.data(), bytes);
  }
  return word;
}

/// The digest of a key of at most seven bytes, given as the beginning of its object in a binary
/// property list: 0x50 and the length in the lowest byte, then the text, then what does not matter.
/// No two of them have one digest: that of a shorter one has more zeros below its first byte, and
/// where there are none, the lowest bit of that byte, which is lost, is known.
constexpr std::uint64_t shortKeyDigest(std::uint64_t object) noexcept {
  return object << 8 * (7 - (object & 7)) >> 1;
}
/// The bits of that digest that are set where a byte of the text is above 0x7f.
inline constexpr std::uint64_t shortKeyHighBits = 0x4040'4040'4040'4040;

/// The digest of a key of at least eight bytes. Calls `see(word)` for words that have all of it.
template <class See>
constexpr std::uint64_t longKeyDigest(std::string_view key, See&& see) noexcept {
  std::uint64_t hash = key.size() * keyFactor;
  const auto add = [&](std::uint64_t word) {
    see(word);
    hash = (hash ^ word) * keyFactor;
    hash ^= hash >> 32;
  };
  for (; key.size() > 8; key.remove_prefix(8)) add(loadWord<8>(key));
  // What is left, and as much before it as makes a word.
  add(loadWord<8>({key.data() + key.size() - 8, 8}));
  return hash * keyFactor | std::uint64_t{1} << 63;
}

/// What a key is known by. A key of at most seven bytes is its digest. Longer ones are told by the
/// highest bit; they may share a digest, and are then to be compared. The digest has no secret:
/// whoever wants keys with one hash can have them, and no look-up may rely on there being few.
constexpr std::uint64_t keyDigest(std::string_view key) noexcept {
  const std::size_t size = key.size();
  if (size >= 8) return longKeyDigest(key, [](std::uint64_t) {});
  std::uint64_t word = 0;
  // Two loads that overlap give each byte its place, whatever the length.
  if (size >= 4) {
    word = loadWord<4>(key) | loadWord<4>(key.substr(size - 4)) << (8 * (size - 4));
  } else if (size > 0) {
    word = loadWord<1>(key) | loadWord<1>(key.substr(size / 2)) << (8 * (size / 2)) |
           loadWord<1>(key.substr(size - 1)) << (8 * (size - 1));
  }
  return shortKeyDigest(word << 8 | 0x50 | size);
}

/// Whether the digest is all of the key.
constexpr bool isWholeKey(std::uint64_t digest) noexcept {
  return digest >> 63 == 0;
}

/// Whether two keys of at least 8 bytes are the same. By words: a call takes longer than they do.
constexpr bool isSameLongKey(std::string_view left, std::string_view right) noexcept {
  if (left.size() != right.size()) return false;
  // The last word overlaps the one before it.
  const std::size_t last = left.size() - 8;
  const auto isSameAt = [&](std::size_t at) {
    return loadWord<8>({left.data() + at, 8}) == loadWord<8>({right.data() + at, 8});
  };
  for (std::size_t at = 0; at < last; at += 8) {
    if (!isSameAt(at)) return false;
  }
  return isSameAt(last);
}

/// A number of so many bits, 1 to 63, in which all of the digest has a say.
constexpr std::size_t keyHash(std::uint64_t digest, int bits) noexcept {
  return static_cast<std::size_t>(digest * keyFactor >> (64 - bits));
}

}  // namespace PropertyList
