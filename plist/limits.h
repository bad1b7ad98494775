// SPDX-License-Identifier: Apache-2.0
// Every limit of the readers, with the reason for its number.
#pragma once

#include <cstddef>
#include <cstdint>

namespace PropertyList::Limits {

// Bytes. Positions and counts are kept in 32 bits, so that a node takes 16 bytes.
inline constexpr std::uint64_t messageLength = 0xFFFF'FFFF;

// Containers around and including the innermost one; the top counts as one. The schemas nest
// about 6 deep; 512 is what people who generate property lists may meet by accident, and it keeps
// the explicit stack of a reader at a fixed few KiB.
inline constexpr std::size_t nestedContainers = 512;

// Bytes that the objects of a binary message may claim altogether, as base + factor x length.
// Objects that do not overlap claim less than the message's length. A message whose objects all
// claim one long string would otherwise have it scanned, and converted, once per object.
inline constexpr std::uint64_t claimedBase = std::uint64_t{64} << 10;
inline constexpr std::uint64_t claimedFactor = 4;

// Bytes that a reader may produce from shared objects, as base + factor x length. Writers share
// equal scalars, so honest messages repeat short strings and numbers; a 64-fold growth is far
// above what they reach, and keeps the worst message's cost linear in its size.
inline constexpr std::uint64_t expansionBase = std::uint64_t{1} << 20;
inline constexpr std::uint64_t expansionFactor = 64;

// Keys of at most so many bytes are compared directly wherever they occur. Longer ones, which a
// binary message could name from a million dictionaries at a byte each, are ranked once instead.
inline constexpr std::size_t shortKey = 64;

// So few strings are compared pair by pair: cheaper than any ordering, and at most 28 pairs.
inline constexpr std::size_t fewStrings = 8;

}  // namespace PropertyList::Limits
