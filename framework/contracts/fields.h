// SPDX-License-Identifier: Apache-2.0
/// The fields of a described struct, as a set, and looked at by their types: so that a walk over
/// the few that a message has does not ask for all 156, a function for a type serves all its
/// fields, and a walk comes to the fields of one type after one another.
///
/// Values and constants, usable at compile time and from any thread.
#pragma once

#include <keelgate/describe.h>

#include <array>
#include <bit>
#include <concepts>
#include <cstddef>
#include <cstdint>

namespace Keelgate {

/// Some of a struct's fields, by position, each less than `size`: a bit for each.
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

/// The members of T that are of type V, by the position of their field; null for the others.
template <class T, class V>
constexpr auto membersOf = [] {
  std::array<V T::*, FieldsOf<T>::size> members{};
  std::size_t position = 0;
  FieldsOf<T>::each([&]<class Value>(Field<T, Value> field) {
    if constexpr (std::same_as<Value, V>) members[position] = field.member;
    ++position;
  });
  return members;
}();

/// The order of such a walk. Where types take turns, a processor foresees few of the jumps to their
/// code, and each costs as much as a short field.
template <class T>
class ByType {
  /// The position of the first field of type V.
  template <class V>
  static constexpr std::size_t firstOf = [] {
    std::size_t first = 0;
    bool isFound = false;
    FieldsOf<T>::each([&]<class Value>(Field<T, Value>) {
      isFound = isFound || std::same_as<Value, V>;
      if (!isFound) ++first;
    });
    return first;
  }();

 public:
  static constexpr std::size_t size = FieldsOf<T>::size;
  /// The position of a field by its place in the walk, and the other way round.
  std::array<std::uint16_t, size> positions{};
  std::array<std::uint16_t, size> places{};

  constexpr ByType() {
    std::array<std::size_t, size> firsts{};
    std::size_t position = 0;
    FieldsOf<T>::each([&]<class V>(Field<T, V>) { firsts[position++] = firstOf<V>; });
    std::size_t place = 0;
    for (std::size_t first = 0; first < size; ++first) {
      for (std::size_t i = first; i < size; ++i) {
        if (firsts[i] != first) continue;
        places[i] = static_cast<std::uint16_t>(place);
        positions[place++] = static_cast<std::uint16_t>(i);
      }
    }
  }
};
template <class T>
constexpr ByType<T> byType;

}  // namespace Keelgate
