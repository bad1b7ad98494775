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

/// What a key is known by. A key of at most seven bytes is its digest: length and bytes, so that
/// two of them are the same where their digests are. Longer ones are told by the highest bit; they
/// may share a digest, and are then to be compared. The digest has no secret: whoever wants keys
/// with one hash can have them, and no look-up may rely on there being few.
constexpr std::uint64_t keyDigest(std::string_view key) noexcept {
  const std::size_t size = key.size();
  if (size < 8) {
    std::uint64_t word = 0;
    // Two loads that overlap give each byte its place, whatever the length.
    if (size >= 4) {
      word = loadWord<4>(key) | loadWord<4>(key.substr(size - 4)) << (8 * (size - 4));
    } else if (size > 0) {
      word = loadWord<1>(key) | loadWord<1>(key.substr(size / 2)) << (8 * (size / 2)) |
             loadWord<1>(key.substr(size - 1)) << (8 * (size - 1));
    }
    return word | std::uint64_t{size} << 56;
  }
  std::uint64_t hash = size * keyFactor;
  const auto add = [&hash](std::uint64_t word) {
    hash = (hash ^ word) * keyFactor;
    hash ^= hash >> 32;
  };
  for (; key.size() > 8; key.remove_prefix(8)) add(loadWord<8>(key));
  // What is left, and as much before it as makes a word.
  add(loadWord<8>({key.data() + key.size() - 8, 8}));
  return hash * keyFactor | std::uint64_t{1} << 63;
}

/// The same of a key of at most seven bytes, given as the lowest bytes of a number, first byte
/// lowest. What stands above them does not matter.
constexpr std::uint64_t shortKeyDigest(std::uint64_t bytes, std::size_t size) noexcept {
  return (bytes & ~(~std::uint64_t{0} << 8 * size)) | std::uint64_t{size} << 56;
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
