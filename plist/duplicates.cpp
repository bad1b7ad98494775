// SPDX-License-Identifier: Apache-2.0
// Sorting out strings by a fingerprint, so that most are never compared with any other.
#include "plist/duplicates.h"

#include <algorithm>
#include <bit>
#include <cstdint>

#include "plist/cursor.h"
#include "plist/limits.h"
#include "plist/small_buffer.h"

namespace PropertyList {
namespace {

// Looks at the beginning, the middle and the end: it has to be cheap, not good.
std::uint64_t fingerprint(std::string_view s) noexcept {
  constexpr std::uint64_t mix = 0x9E37'79B9'7F4A'7C15;
  const std::size_t size = s.size();
  std::uint64_t hash = size * mix;
  if (size >= 8) {
    hash = (hash ^ Cursor::wordAt<std::uint64_t>(s, 0)) * mix;
    hash = (std::rotl(hash, 29) ^ Cursor::wordAt<std::uint64_t>(s, size / 2 - 4)) * mix;
    hash = (std::rotl(hash, 29) ^ Cursor::wordAt<std::uint64_t>(s, size - 8)) * mix;
  } else if (size >= 2) {
    const std::uint64_t ends = std::uint64_t{Cursor::wordAt<std::uint16_t>(s, 0)} << 16 |
                               Cursor::wordAt<std::uint16_t>(s, size - 2);
    hash = (hash ^ ends << 16 ^ Cursor::wordAt<std::uint16_t>(s, size / 2 - 1)) * mix;
  } else if (size == 1) {
    hash = (hash ^ Cursor::wordAt<std::uint8_t>(s, 0)) * mix;
  }
  return hash;
}

bool pairwise(std::span<const std::string_view> strings) noexcept {
  for (std::size_t i = 1; i < strings.size(); ++i) {
    for (std::size_t j = 0; j < i; ++j) {
      if (strings[i] == strings[j]) return true;
    }
  }
  return false;
}

// Few strings are suspect unless someone arranged otherwise; then they are sorted.
bool amongSuspects(std::span<std::string_view> suspects) {
  if (suspects.size() <= Limits::fewStrings) return pairwise(suspects);
  std::sort(suspects.begin(), suspects.end(), isBefore);
  return std::adjacent_find(suspects.begin(), suspects.end()) != suspects.end();
}

// One bit per slot.
using Slots = SmallBuffer<std::uint64_t, 64>;

}  // namespace

bool isBefore(std::string_view left, std::string_view right) noexcept {
  return left.size() != right.size() ? left.size() < right.size() : left < right;
}

bool hasDuplicates(std::span<const std::string_view> strings) {
  if (strings.size() <= Limits::fewStrings) return pairwise(strings);

  // So many slots that two different strings seldom meet in one; equal ones always do.
  const std::size_t slots = 16 * std::bit_ceil(strings.size());
  // All of a string has a say in the fingerprint's highest bits alone.
  const int shift = 64 - std::countr_zero(slots);
  SmallBuffer<std::uint32_t, 64> slotOf;
  Slots seen;
  Slots seenAgain;
  slotOf.resize(strings.size());
  seen.zero(slots / 64);
  seenAgain.zero(slots / 64);
  for (std::size_t i = 0; i < strings.size(); ++i) {
    const auto slot = static_cast<std::uint32_t>(fingerprint(strings[i]) >> shift);
    const std::uint64_t bit = std::uint64_t{1} << slot % 64;
    seenAgain[slot / 64] |= seen[slot / 64] & bit;
    seen[slot / 64] |= bit;
    slotOf[i] = slot;
  }

  SmallBuffer<std::string_view, 64> suspects;
  for (std::size_t i = 0; i < strings.size(); ++i) {
    if ((seenAgain[slotOf[i] / 64] >> slotOf[i] % 64 & 1) != 0) suspects.push(strings[i]);
  }
  return amongSuspects(suspects.all());
}

}  // namespace PropertyList
