// SPDX-License-Identifier: Apache-2.0
/// The fields of a described struct, as a set, and looked at by their types: so that a walk over
/// the few that a message has does not ask for all 156, and one call of one function serves all
/// fields of a type.
///
/// Values and constants, usable at compile time and from any thread.
#pragma once

#include <keelgate/describe.h>

#include <algorithm>
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
  [[nodiscard]] constexpr FieldSet operator&(const FieldSet& other) const {
    FieldSet both;
    for (std::size_t i = 0; i < words_.size(); ++i) both.words_[i] = words_[i] & other.words_[i];
    return both;
  }
  [[nodiscard]] constexpr bool isEmpty() const { return words_ == Words{}; }

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

/// The position of T's first field of type V: what tells types apart at compile time.
template <class T, class V>
constexpr std::size_t firstOf = [] {
  std::size_t first = 0;
  bool isFound = false;
  FieldsOf<T>::each([&]<class Value>(Field<T, Value>) {
    isFound = isFound || std::same_as<Value, V>;
    if (!isFound) ++first;
  });
  return first;
}();

/// The order of a walk by type. Where types take turns, a processor foresees few of the jumps to
/// their code, and each costs as much as a short field.
template <class T>
class ByType {
 public:
  static constexpr std::size_t size = FieldsOf<T>::size;
  /// The position of a field by its place in the walk, and the other way round.
  std::array<std::uint16_t, size> positions{};
  std::array<std::uint16_t, size> places{};

  constexpr ByType() {
    std::array<std::size_t, size> firsts{};
    std::size_t position = 0;
    FieldsOf<T>::each([&]<class V>(Field<T, V>) { firsts[position++] = firstOf<T, V>; });
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

/// The function that serves all fields of one kind, called with those of them that are there.
template <class Function, std::size_t size>
struct FieldFunction {
  /// A number, since functions cannot be compared at compile time where sanitizers are on.
  std::size_t kind = 0;
  Function function = nullptr;
  /// By their places in the walk.
  FieldSet<size> fields;
};

/// Collects them at compile time. Kinds keep the order of their first fields.
template <class Function, std::size_t size>
struct FieldFunctions {
  std::array<FieldFunction<Function, size>, size> all{};
  std::size_t count = 0;

  constexpr void insert(std::size_t kind, Function function, std::size_t place) {
    std::size_t i = 0;
    while (i < count && all[i].kind != kind) ++i;
    if (i == count) all[count++] = {.kind = kind, .function = function, .fields = {}};
    all[i].fields.insert(place);
  }
};

/// Without the room that is left over.
template <const auto& functions>
constexpr auto trimmed = [] {
  auto used = [&]<class One, std::size_t size>(const std::array<One, size>&) {
    return std::array<One, functions.count>{};
  }(functions.all);
  std::copy_n(functions.all.begin(), functions.count, used.begin());
  return used;
}();

/// Calls `function(fields, arguments…)` for each kind of which some are there: one call for all of
/// a kind takes a twentieth off the time to a record.
template <class Function, std::size_t size, std::size_t count, class... Arguments>
void callEach(const std::array<FieldFunction<Function, size>, count>& functions,
              const FieldSet<size>& present, Arguments&... arguments) {
  for (const auto& one : functions) {
    const FieldSet<size> fields = present & one.fields;
    if (!fields.isEmpty()) one.function(fields, arguments...);
  }
}

}  // namespace Keelgate
