// SPDX-License-Identifier: Apache-2.0
/// Some of a struct's fields, by position: a bit for each, so that a walk over the few that a
/// message has does not ask for all 156.
#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>

namespace Keelgate {

/// A value; usable at compile time. Positions are less than `size`.
template <std::size_t size>
class FieldSet {
 public:
  /// Lowest position first, in the lowest bit of the first word.
  using Words = std::array<std::uint64_t, (size + 63) / 64>;

  constexpr FieldSet() = default;
  constexpr explicit FieldSet(const Words& words) : words_(words) {}
  [[nodiscard]] constexpr const Words& words() const { return words_; }

  constexpr void insert(std::size_t field) { words_[field / 64] |= std::uint64_t{1} << field % 64; }

  [[nodiscard]] constexpr bool contains(std::size_t field) const {
    return (words_[field / 64] >> field % 64 & 1) != 0;
  }

  /// The first field that the other set has and this one lacks, or `size`.
  [[nodiscard]] constexpr std::size_t firstMissing(const FieldSet& other) const {
    for (std::size_t i = 0; i < words_.size(); ++i) {
      const std::uint64_t missing = other.words_[i] & ~words_[i];
      if (missing != 0) return 64 * i + static_cast<std::size_t>(std::countr_zero(missing));
    }
    return size;
  }

  /// Calls `visitor(field)` for the fields, in ascending order.
  template <class Visitor>
  constexpr void each(Visitor&& visitor) const {
    for (std::size_t i = 0; i < words_.size(); ++i) {
      for (std::uint64_t left = words_[i]; left != 0; left &= left - 1) {
        visitor(64 * i + static_cast<std::size_t>(std::countr_zero(left)));
      }
    }
  }

 private:
  Words words_{};
};

}  // namespace Keelgate
