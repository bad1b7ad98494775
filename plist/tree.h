// SPDX-License-Identifier: Apache-2.0
/// A property list to be written: an ordinary tree of values, dictionaries in the order given.
///
///   Tree tree = Dictionary{{"c", 232}, {"client", "sample"}, {"list", Array{1, 2.5, true}}};
///
/// Values; may be used from any thread as any value may.
#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace PropertyList {

struct Tree;

/// Any double; a writer refuses what its format cannot say.
struct Date {
  double seconds;  // since 2001-01-01T00:00:00Z

  bool operator==(const Date&) const = default;
};

/// No field takes one. It is here so that messages that have one can be made.
struct Uid {
  std::uint64_t number;

  bool operator==(const Uid&) const = default;
};

/// Dictionaries keep their order, since readers may depend on it and the mirror encoding does.
using Data = std::vector<std::byte>;
using Array = std::vector<Tree>;
using Dictionary = std::vector<std::pair<std::string, Tree>>;
struct Set {
  Array elements;

  bool operator==(const Set&) const;
};

/// One type with all cases, so that tests can write down what no schema has.
struct Tree {
  using Variant = std::variant<std::nullptr_t, bool, std::int64_t, std::uint64_t, double, Date,
                               std::string, Data, Array, Dictionary, Uid, Set>;

  // Implicit, so that a message can be written down as nested braces.
  Tree(std::nullptr_t) noexcept : value(nullptr) {}
  Tree(bool boolean) noexcept : value(boolean) {}
  // With or without a sign is kept: it decides how a number with its highest bit set is written.
  template <std::signed_integral Number>
  Tree(Number number) noexcept : value(std::int64_t{number}) {}
  template <std::unsigned_integral Number>
  Tree(Number number) noexcept : value(std::uint64_t{number}) {}
  Tree(double number) noexcept : value(number) {}
  Tree(Date date) noexcept : value(date) {}
  Tree(std::string_view text) : value(std::string(text)) {}
  Tree(const char* text) : value(std::string(text)) {}
  Tree(std::string text) noexcept : value(std::move(text)) {}
  Tree(Data bytes) noexcept : value(std::move(bytes)) {}
  Tree(Array elements) noexcept : value(std::move(elements)) {}
  Tree(Dictionary entries) noexcept : value(std::move(entries)) {}
  Tree(Uid uid) noexcept : value(uid) {}
  Tree(Set set) noexcept : value(std::move(set)) {}

  // By type and content; 5 as a signed and as an unsigned number differ, and no NaN is equal.
  bool operator==(const Tree&) const = default;

  Variant value;
};

inline bool Set::operator==(const Set& other) const {
  return elements == other.elements;
}

}  // namespace PropertyList
