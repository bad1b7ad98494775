// SPDX-License-Identifier: Apache-2.0
// Whether a string occurs twice, at a cost that no choice of strings can raise.
//
// A hash table over the message's own strings would invite messages made of collisions. Here a
// fingerprint only clears strings of suspicion; whoever makes all fingerprints collide gets an
// ordinary sort: n strings of t bytes altogether cost at most about (n + t) log n.
//
// Pure functions; may be used from any thread.
#pragma once

#include <span>
#include <string_view>

namespace PropertyList {

// Throws std::bad_alloc.
bool hasDuplicates(std::span<const std::string_view> strings);

// The order behind it: shorter first, so that only strings of one length are ever compared byte
// by byte, then by bytes.
bool isBefore(std::string_view left, std::string_view right) noexcept;

}  // namespace PropertyList
