// SPDX-License-Identifier: Apache-2.0
/// Enumerations that know the names and raw values of their cases.
///
///     ENUMERATION(Colour, UInt, red = 1, green = 2);
///     DEFAULTING_ENUMERATION(Shade, UInt, unknown, unknown = 0, dark = 1, light = 2);
///
///     rawValueOf(Colour::red); nameOf(Colour::red); fromRawValue<Colour>(7); defaulting<Shade>(7);
///
/// The list is written once: it is the enumerators, and its text is read at compile time for the
/// table. Every case states its raw value, because the values travel. NESTED_ENUMERATION is the
/// form for an enumeration inside a struct. The macros exist only between
/// <keelgate/describe_begin.h> and <keelgate/describe_end.h>.
///
/// Values and pure functions; callable from any thread. Nothing throws.
#pragma once

#include <keelgate/values.h>

#include <array>
#include <cstddef>
#include <string_view>
#include <type_traits>

namespace Keelgate {

/// A case as `describe` and JSON show it. Never negative: the list takes decimal digits alone, so a
/// negative number on the wire is an unknown one.
struct EnumerationCase {
  std::string_view name;
  UInt64 rawValue;
};

namespace Detail {

/// How many names stand in a list with commas, which no name can hold.
constexpr std::size_t countNames(std::string_view list) {
  std::size_t n = 1;
  for (char c : list) n += c == ',' ? 1 : 0;
  return n;
}

/// Of the spaces that the preprocessor leaves; it leaves no other white space.
constexpr std::string_view trim(std::string_view text) {
  while (!text.empty() && text.front() == ' ') text.remove_prefix(1);
  while (!text.empty() && text.back() == ' ') text.remove_suffix(1);
  return text;
}

/// "a = 1, b = 2" as its cases. A case without a number, or with anything but decimal digits for
/// one, has no place in a table of raw values: reading it is no constant expression.
template <std::size_t n>
constexpr std::array<EnumerationCase, n> casesIn(std::string_view list) {
  std::array<EnumerationCase, n> cases{};
  for (EnumerationCase& entry : cases) {
    const std::string_view item = list.substr(0, list.find(','));
    list.remove_prefix(item.size() == list.size() ? item.size() : item.size() + 1);
    const std::size_t equals = item.find('=');
    entry.name = trim(item.substr(0, equals));
    const std::string_view digits = trim(item.substr(equals + 1));
    for (char c : digits) {
      if (c < '0' || c > '9') throw "a raw value is a decimal number";
      entry.rawValue = entry.rawValue * 10 + static_cast<UInt64>(c - '0');
    }
  }
  return cases;
}

/// The same for a list of names alone, as the cases of a variant have it.
template <std::size_t n>
constexpr std::array<std::string_view, n> namesIn(std::string_view list) {
  std::array<std::string_view, n> names{};
  for (std::string_view& name : names) {
    const std::string_view item = list.substr(0, list.find(','));
    list.remove_prefix(item.size() == list.size() ? item.size() : item.size() + 1);
    name = trim(item);
  }
  return names;
}

}  // namespace Detail

/// An enumeration that was declared by one of the macros; found by its argument, so that it may
/// stand in any namespace or class.
template <class E>
concept Enumeration = std::is_enum_v<E> && requires(E value) {
  keelgateCases(value);
};

/// An enumeration that gives a stated case for a number that it does not know.
template <class E>
concept Defaulting = Enumeration<E> && requires(E value) {
  keelgateDefault(value);
};

/// All cases in declaration order. A constant of the program: views of it never end.
template <Enumeration E>
inline constexpr auto casesOf = keelgateCases(E{});

/// The number that travels.
template <Enumeration E>
constexpr UInt64 rawValueOf(E value) {
  return static_cast<UInt64>(value);
}

/// The case with this raw value, or nothing. The only way from a stranger's number to a case: a
/// bare cast would let any number in, and a switch over the cases would run past its end with it.
template <Enumeration E>
constexpr Optional<E> fromRawValue(UInt64 rawValue) {
  for (const EnumerationCase& entry : casesOf<E>) {
    if (entry.rawValue == rawValue) return static_cast<E>(rawValue);
  }
  return std::nullopt;
}

/// The name of a value's case. A value that is no case, which only a cast can make, has none.
template <Enumeration E>
constexpr std::string_view nameOf(E value) {
  for (const EnumerationCase& entry : casesOf<E>) {
    if (entry.rawValue == rawValueOf(value)) return entry.name;
  }
  return {};
}

/// The case with this raw value, or the enumeration's default. For the few codes for which an
/// unknown number is no error.
template <Defaulting E>
constexpr E defaulting(UInt64 rawValue) {
  return fromRawValue<E>(rawValue).value_or(keelgateDefault(E{}));
}

/// The same for an optional number: absent stays absent. The default is what an unknown code means,
/// and never what a missing one does.
template <Defaulting E>
constexpr Optional<E> defaulting(Optional<UInt> rawValue) {
  if (!rawValue) return std::nullopt;
  return defaulting<E>(UInt64{*rawValue});
}

}  // namespace Keelgate
