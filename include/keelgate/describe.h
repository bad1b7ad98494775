// SPDX-License-Identifier: Apache-2.0
/// Structs that describe themselves.
///
/// A struct lists its members once, as a schema (what is decoded from a message) or as a record
/// (what the client gets). The list becomes the members, and everything that has to know them walks
/// it: decoding, mirror encoding, transport, JSON and `keelgate describe`.
///
///     struct Point {
///       KEELGATE_SCHEMA(Point,
///         (Int, x),
///         (Optional<Int>, height, "h")   // travels under the key "h"
///       );
///     };
///
///     FieldsOf<Point>::each([&](auto field) { print(field.name, point.*field.member); });
///
/// It stays an aggregate with the members x and height. It also gets a nested struct
/// KeelgateFields, with the types of the members, their positions, a switch from a position to its
/// Field, and a function that visits every value. Nothing else is generated; FieldList, below, is
/// the interface to it.
///
/// A visitor is instantiated for each type of value and not for each field, because fields are
/// passed as values; with structs of 156 fields that is the difference between seconds and minutes
/// of compile time.
///
/// Everything happens at compile time: constants, pure functions and no state. Callable from any
/// thread; nothing here throws, a visitor may.
#pragma once

#include <keelgate/enumeration.h>
#include <keelgate/for_each.h>
#include <keelgate/type_name.h>
#include <keelgate/values.h>

#include <array>
#include <concepts>
#include <cstddef>
#include <string_view>
#include <utility>

/// The list of a schema: (Type, name), or (Type, name, "key") where the wire key differs.
#define KEELGATE_SCHEMA(Self_, ...)       \
  KEELGATE_DESCRIBED_(Self_, __VA_ARGS__) \
  using CodingKeys = ::Keelgate::FieldList<Self_>

/// The list of a record: (Type, name). A record has no keys.
#define KEELGATE_RECORD(Self_, ...)       \
  KEELGATE_DESCRIBED_(Self_, __VA_ARGS__) \
  using Labels = ::Keelgate::FieldList<Self_>

#define KEELGATE_DESCRIBED_(Self_, ...)                                                           \
  KEELGATE_FOR_EACH(KEELGATE_MEMBER_, __VA_ARGS__)                                                \
  struct KeelgateFields {                                                                         \
    using Self = Self_;                                                                           \
    using Types = ::Keelgate::Detail::Types<void KEELGATE_FOR_EACH(KEELGATE_TYPE_, __VA_ARGS__)>; \
    struct Position {                                                                             \
      enum { KEELGATE_FOR_EACH(KEELGATE_POSITION_, __VA_ARGS__) keelgateSize };                   \
    };                                                                                            \
    template <class Visitor>                                                                      \
    static constexpr void at(std::size_t position, Visitor& visitor) {                            \
      switch (position) { KEELGATE_FOR_EACH(KEELGATE_VISIT_, __VA_ARGS__) }                       \
    }                                                                                             \
    template <class Visitor>                                                                      \
    [[gnu::always_inline]] static constexpr void values(const Self& self, Visitor& visitor) {     \
      KEELGATE_FOR_EACH(KEELGATE_VALUE_, __VA_ARGS__)                                             \
    }                                                                                             \
  };
#define KEELGATE_MEMBER_(Type, name_, ...)   Type name_;
#define KEELGATE_TYPE_(Type, name_, ...)     , Type
#define KEELGATE_POSITION_(Type, name_, ...) name_,
#define KEELGATE_VISIT_(Type, name_, ...) \
  case Position::name_:                   \
    return visitor(::Keelgate::Field<Self, Type>(&Self::name_, #name_ __VA_OPT__(, ) __VA_ARGS__));
#define KEELGATE_VALUE_(Type, name_, ...) visitor(self.name_);

namespace Keelgate {

/// One described member: where it is, what it is called, and the key that it travels under. A value
/// and not a type with the member in its arguments, so that one instantiation of a visitor serves
/// all fields of one type. The texts are literals and live as long as the program.
template <class S, class V>
struct Field {
  using Struct = S;
  using Value = V;

  V S::*member;
  std::string_view name;
  std::string_view key;

  constexpr Field(V S::*itsMember, std::string_view itsName) : Field(itsMember, itsName, itsName) {}
  constexpr Field(V S::*itsMember, std::string_view itsName, std::string_view itsKey)
      : member(itsMember), name(itsName), key(itsKey) {}
};

namespace Detail {

/// The types of a struct's members, behind a void that spares the list its first comma. Not a
/// std::tuple, which is slow to compile at 156 elements.
template <class...>
struct Types;

// Whether an S can be made from values of exactly these types, and from one value more.
template <class S, class... V>
auto takes(Types<void, V...>*, int) -> decltype(S{std::declval<V>()...}, std::true_type());
template <class S>
std::false_type takes(...);
template <class S, class... V>
auto takesMore(Types<void, V...>*, int) -> decltype(S{std::declval<V>()..., {}}, std::true_type());
template <class S>
std::false_type takesMore(...);

}  // namespace Detail

/// The list of S, which walkers use. S itself has only an alias of it, because the list cannot be
/// used before S is complete.
template <class S>
class FieldList {
  using Fields = typename S::KeelgateFields;

 public:
  static constexpr std::size_t size = Fields::Position::keelgateSize;

  /// Calls `visitor(field)` for the field at this position, which is less than `size`.
  template <class Visitor>
  static constexpr void at(std::size_t position, Visitor&& visitor) {
    Fields::at(position, visitor);
  }

  /// The same for every field in declaration order.
  template <class Visitor>
  static constexpr void each(Visitor&& visitor) {
    for (std::size_t position = 0; position < size; ++position) Fields::at(position, visitor);
  }

  /// Calls `visitor(value)` for the value of every field in declaration order. Expands to code for
  /// each of them, without a loop: for visitors of an instruction or two.
  template <class Visitor>
  [[gnu::always_inline]] static constexpr void eachValue(const S& of, Visitor&& visitor) {
    Fields::values(of, visitor);
  }

  /// False if S has a member that is not in its list, which every walker would silently drop. The
  /// compiler is asked whether S can be made from as many values as there are fields, and whether
  /// it cannot be made from one more.
  static constexpr bool isComplete() {
    using All = typename Fields::Types*;
    return decltype(Detail::takes<S>(All(), 0))::value &&
           !decltype(Detail::takesMore<S>(All(), 0))::value;
  }

  /// The key of one member.
  template <class V>
  static constexpr std::string_view keyOf(V S::*member) {
    std::string_view key;
    each([&]<class Value>(Field<S, Value> field) {
      if constexpr (std::same_as<V, Value>) {
        if (field.member == member) key = field.key;
      }
    });
    return key;
  }

  /// The names and the keys in declaration order: arrays, for tables and comparisons at compile
  /// time.
  static constexpr std::array<std::string_view, size> names = [] {
    std::array<std::string_view, size> all{};
    std::size_t n = 0;
    each([&](auto field) { all[n++] = field.name; });
    return all;
  }();
  static constexpr std::array<std::string_view, size> keys = [] {
    std::array<std::string_view, size> all{};
    std::size_t n = 0;
    each([&](auto field) { all[n++] = field.key; });
    return all;
  }();
};

/// What is decoded from a message.
template <class T>
concept Schema = requires {
  typename T::CodingKeys;
};

/// What is handed to the client.
template <class T>
concept Record = requires {
  typename T::Labels;
};

/// Either kind of struct. No struct is both.
template <class T>
concept Described = Schema<T> || Record<T>;

/// The list of either, for walkers that do not care which it is.
template <Described T>
using FieldsOf = FieldList<T>;

/// Whether a value of the type may be absent.
template <class T>
constexpr bool isOptional = false;
template <class T>
constexpr bool isOptional<Optional<T>> = true;

/// An array of values. Data is not one: it is an octet string.
template <class T>
constexpr bool isArray = false;
template <class T>
constexpr bool isArray<Array<T>> = !std::same_as<T, std::byte>;

}  // namespace Keelgate
