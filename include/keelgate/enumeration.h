// SPDX-License-Identifier: Apache-2.0
/// Enumerations that know the names and raw values of their cases, and enumerations whose cases
/// carry a record.
///
///     KEELGATE_ENUMERATION(Colour, UInt, (red, 1), (green, 2));
///     KEELGATE_DEFAULTING_ENUMERATION(Shade, UInt, unknown, (unknown, 0), (dark, 1), (light, 2));
///     KEELGATE_CASES(Shape, (Circle, circle), (Square, square));
///
///     rawValueOf(Colour::red); nameOf(Colour::red); fromRawValue<Colour>(7); defaulting<Shade>(7);
///     Shape(Circle{}).index(); Shape::caseNames[0];
///
/// A list is written once, so the names in JSON and `describe` cannot disagree with the code. Every
/// case of an enumeration states its raw value, because the values travel.
///
/// Values and pure functions; callable from any thread. Nothing throws.
#pragma once

#include <keelgate/for_each.h>
#include <keelgate/values.h>

#include <array>
#include <string_view>
#include <type_traits>
#include <variant>

#define KEELGATE_ENUMERATION(Name_, Raw_, ...) KEELGATE_ENUMERATION_(, Name_, Raw_, __VA_ARGS__)

/// The form inside a class, where only a friend function is found by argument-dependent lookup.
#define KEELGATE_NESTED_ENUMERATION(Name_, Raw_, ...) \
  KEELGATE_ENUMERATION_(friend, Name_, Raw_, __VA_ARGS__)

/// For codes that a newer sender may add to: an unknown number becomes `default_`.
#define KEELGATE_DEFAULTING_ENUMERATION(Name_, Raw_, default_, ...) \
  KEELGATE_ENUMERATION(Name_, Raw_, __VA_ARGS__);                   \
  constexpr Name_ keelgateDefault(Name_) {                          \
    return Name_::default_;                                         \
  }                                                                 \
  static_assert(true)

/// A struct that derives from a std::variant of the records, in order, and has their cases' names.
#define KEELGATE_CASES(Name_, ...)                                                              \
  struct Name_                                                                                  \
      : ::Keelgate::Detail::Cases<void KEELGATE_FOR_EACH(KEELGATE_CASE_RECORD_, __VA_ARGS__)> { \
    using variant::variant;                                                                     \
    static constexpr std::array caseNames =                                                     \
        std::to_array<std::string_view>({KEELGATE_FOR_EACH(KEELGATE_CASE_NAME_, __VA_ARGS__)}); \
  }

#define KEELGATE_ENUMERATION_(friend_, Name_, Raw_, ...)                            \
  enum class Name_ : Raw_ { KEELGATE_FOR_EACH(KEELGATE_ENUMERATOR_, __VA_ARGS__) }; \
  friend_ constexpr auto keelgateCases(Name_) {                                     \
    return std::to_array<::Keelgate::EnumerationCase>(                              \
        {KEELGATE_FOR_EACH(KEELGATE_ENUMERATION_CASE_, __VA_ARGS__)});              \
  }                                                                                 \
  static_assert(true)
#define KEELGATE_ENUMERATOR_(name_, number_)       name_ = number_,
#define KEELGATE_ENUMERATION_CASE_(name_, number_) {#name_, number_},
#define KEELGATE_CASE_RECORD_(Record_, name_)      , Record_
#define KEELGATE_CASE_NAME_(Record_, name_)        #name_,

namespace Keelgate {

/// A case as `describe` and JSON show it. Its number is never negative: a negative number on the
/// wire is always an unknown one.
struct EnumerationCase {
  std::string_view name;
  UInt64 rawValue;
};

namespace Detail {
/// The void spares the list its first comma.
template <class, class... Record>
using Cases = std::variant<Record...>;
}  // namespace Detail

/// An enumeration that was declared by one of the macros. It may be in any namespace or class:
/// argument-dependent lookup finds its cases.
template <class E>
concept Enumeration = std::is_enum_v<E> && requires(E value) {
  keelgateCases(value);
};

/// An enumeration with a default case for numbers that it does not know.
template <class E>
concept Defaulting = Enumeration<E> && requires(E value) {
  keelgateDefault(value);
};

/// An enumeration whose cases each carry a record.
template <class T>
concept CaseKeyed = requires {
  T::caseNames;
};

/// All cases in declaration order. A constant: views of it are always valid.
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

/// The name of a value's case; empty for a value without a case, which only a cast can make.
template <Enumeration E>
constexpr std::string_view nameOf(E value) {
  for (const EnumerationCase& entry : casesOf<E>) {
    if (entry.rawValue == rawValueOf(value)) return entry.name;
  }
  return {};
}

/// The case with this raw value, or the enumeration's default. For the few codes where an unknown
/// number is not an error.
template <Defaulting E>
constexpr E defaulting(UInt64 rawValue) {
  return fromRawValue<E>(rawValue).value_or(keelgateDefault(E{}));
}

/// The same for an optional number: absent stays absent. The default stands for an unknown code,
/// never for a missing one.
template <Defaulting E>
constexpr Optional<E> defaulting(Optional<UInt> rawValue) {
  if (!rawValue) return std::nullopt;
  return defaulting<E>(UInt64{*rawValue});
}

}  // namespace Keelgate
