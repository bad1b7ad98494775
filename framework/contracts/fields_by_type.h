// SPDX-License-Identifier: Apache-2.0
/// The fields of a described struct, looked at by their types: so that a function for a type serves
/// all its fields, and a walk comes to the fields of one type after one another.
///
/// Constants, made by the compiler; usable from any thread.
#pragma once

#include <keelgate/describe.h>

#include <array>
#include <concepts>
#include <cstddef>
#include <cstdint>

namespace Keelgate {

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
