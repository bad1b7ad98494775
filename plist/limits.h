// SPDX-License-Identifier: Apache-2.0
/// Every limit of the readers, with the reason for its number.
#pragma once

#include <cstddef>
#include <cstdint>

namespace PropertyList::Limits {

/// Bytes, of the message and of the text that is converted or unescaped. Positions and counts are
/// kept in 32 bits, so that a node takes 16 bytes.
inline constexpr std::uint64_t length = 0xffff'ffff;

/// Containers around and including the innermost one; the top counts as one. The schemas nest
/// about 6 deep; 512 is what people who generate property lists may meet by accident, and it keeps
/// the explicit stack of a reader at 16 KiB.
inline constexpr std::size_t nestedContainers = 512;

/// Bytes that the objects of a binary message may claim altogether, as base + factor x length.
/// Objects that do not overlap claim less than the message's length. A message whose objects all
/// claim one long string would otherwise have it scanned, and converted, once per object.
inline constexpr std::uint64_t claimedBase = std::uint64_t{64} << 10;
inline constexpr std::uint64_t claimedFactor = 4;

/// Bytes that may be made from shared objects, as base + factor x length. Writers share equal
/// scalars, so honest messages repeat short strings, and reach a few times their length. What is
/// made is held up to three times, as schema, record and reply, so 16 keeps a message whose sharing
/// is refused below the 64 bytes a byte at which a worker's memory ends: the sender is told that
/// the message is malformed, whatever its size.
inline constexpr std::uint64_t expansionBase = std::uint64_t{1} << 20;
inline constexpr std::uint64_t expansionFactor = 16;

}  // namespace PropertyList::Limits
