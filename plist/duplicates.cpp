// SPDX-License-Identifier: Apache-2.0
// Grouping strings by a fingerprint, so that most are never compared with any other.
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
  return hash ^ (hash >> 32);
}

bool pairwise(std::span<const std::string_view> strings) noexcept {
  for (std::size_t i = 1; i < strings.size(); ++i) {
    for (std::size_t j = 0; j < i; ++j) {
      if (strings[i] == strings[j]) return true;
    }
  }
  return false;
}

// A group is small unless someone arranged otherwise; then it is sorted.
bool inGroup(std::span<std::string_view> group) {
  if (group.size() <= Limits::fewStrings) return pairwise(group);
  std::sort(group.begin(), group.end(), isBefore);
  return std::adjacent_find(group.begin(), group.end()) != group.end();
}

}  // namespace

bool isBefore(std::string_view left, std::string_view right) noexcept {
  return left.size() != right.size() ? left.size() < right.size() : left < right;
}

bool hasDuplicates(std::span<const std::string_view> strings) {
  if (strings.size() <= Limits::fewStrings) return pairwise(strings);

  // A counting sort by the fingerprint's low bits, into about as many groups as strings.
  const std::size_t groups = std::bit_ceil(strings.size());
  SmallBuffer<std::uint32_t, 64> groupOf;
  SmallBuffer<std::uint32_t, 65> ends;
  SmallBuffer<std::string_view, 64> sorted;
  groupOf.resize(strings.size());
  ends.zero(groups + 1);
  sorted.resize(strings.size());
  for (std::size_t i = 0; i < strings.size(); ++i) {
    groupOf[i] = static_cast<std::uint32_t>(fingerprint(strings[i]) & (groups - 1));
    ++ends[groupOf[i] + 1];
  }
  for (std::size_t group = 1; group <= groups; ++group) ends[group] += ends[group - 1];
  for (std::size_t i = 0; i < strings.size(); ++i) sorted[ends[groupOf[i]]++] = strings[i];

  // Placing the strings has moved each group's entry from its beginning to its end.
  std::size_t begin = 0;
  for (std::size_t group = 0; group < groups; ++group) {
    const std::size_t end = ends[group];
    if (end - begin > 1 && inGroup(sorted.all().subspan(begin, end - begin))) return true;
    begin = end;
  }
  return false;
}

}  // namespace PropertyList
