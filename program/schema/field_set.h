// SPDX-License-Identifier: Apache-2.0
/// Some of a schema's fields, by position: a bit for each, so that a walk over the few that a
/// message has does not ask for all 156.
#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>

namespace VespKeelgateService {

/// A value; usable at compile time. Positions are less than `size`.
template <std::size_t size>
class FieldSet {
 public:
  constexpr void insert(std::size_t field) { words_[field / 64] |= std::uint64_t{1} << field % 64; }
  [[nodiscard]] constexpr bool contains(std::size_t field) const {
    return (words_[field / 64] >> field % 64 & 1) != 0;
  }

  /// Calls `visitor(field)` for the fields of either set, in ascending order.
  template <class Visitor>
  constexpr void eachOfEither(const FieldSet& other, Visitor&& visitor) const {
    for (std::size_t i = 0; i < words_.size(); ++i) {
      for (std::uint64_t left = words_[i] | other.words_[i]; left != 0; left &= left - 1) {
        visitor(64 * i + static_cast<std::size_t>(std::countr_zero(left)));
      }
    }
  }

 private:
  std::array<std::uint64_t, (size + 63) / 64> words_{};
};

}  // namespace VespKeelgateService
