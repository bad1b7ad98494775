// SPDX-License-Identifier: Apache-2.0
/// Structs that describe themselves.
///
/// A struct lists its members once, with FIELD, and closes with CODING_KEYS (a schema) or LABELS
/// (a record). It stays an aggregate. Everything that has to know the members walks that one list:
/// decoding, mirror encoding, transport, JSON and `keelgate describe`.
///
///     struct Point {
///       FIELD(Int, x);
///       FIELD(Optional<Int>, height, "h");   // travels under the key "h"
///       CODING_KEYS(Point);
///     };
///
///     FieldsOf<Point>::each([&](auto field) { print(field.name, point.*field.member); });
///
/// The macros exist only between <keelgate/describe_begin.h> and <keelgate/describe_end.h>.
///
/// How a list is found: every FIELD also declares an overload of `keelgateField` for its own source
/// line, and the closing macro asks each of the lines above it whether there is one. Lines are the
/// same in every translation unit, which __COUNTER__ is not. A walker is instantiated per type of
/// value and not per field, because fields are passed as values; with structs of 156 fields that is
/// the difference between seconds and minutes of compile time.
///
/// Everything happens at compile time: constants, pure functions and no state. Callable from any
/// thread; nothing here throws, a visitor may.
#pragma once

#include <keelgate/enumeration.h>
#include <keelgate/type_name.h>
#include <keelgate/values.h>

#include <algorithm>
#include <array>
#include <concepts>
#include <cstddef>
#include <string_view>
#include <type_traits>
#include <utility>

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

// Never defined: a pointer to it is a source line as a type, which overloads can be chosen by.
template <int line>
struct Line;

// Only asked when S is complete: an answer given earlier would stand for good.
template <class S, int line>
concept HasField = requires {
  S::template keelgateField<S>(static_cast<Line<line>*>(nullptr));
};

// How far above its closing macro a struct may begin. A list that begins further up is not
// complete, which is asserted where structs are decoded. The largest struct, a payload of 156
// fields and its comments, takes some 200 lines.
constexpr int span = 240;

// A line declares one field, or with FIELD_FAMILY an array of them.
template <class F>
struct FieldCount : std::integral_constant<std::size_t, 1> {};
template <class F, std::size_t n>
struct FieldCount<std::array<F, n>> : std::integral_constant<std::size_t, n> {};

// A list of types that is only ever added up. Not a std::tuple, which is slow to compile at 156
// elements.
template <class... V>
struct Types {
  template <class... W>
  constexpr Types<V..., W...> operator+(Types<W...>) const {
    return {};
  }
};

template <class S, class V>
constexpr Types<V> typesOf(const Field<S, V>&) {
  return {};
}
template <class S, class V, std::size_t n>
constexpr auto typesOf(const std::array<Field<S, V>, n>&) {
  return []<std::size_t... i>(std::index_sequence<i...>) {
    return Types<std::enable_if_t<i >= 0, V>...>();
  }
  (std::make_index_sequence<n>());
}

// Whether an S can be made from values of exactly these types, and from one value more.
template <class S, class... V>
auto takes(Types<V...>, int) -> decltype(S{std::declval<V>()...}, std::true_type());
template <class S>
std::false_type takes(...);
template <class S, class... V>
auto takesMore(Types<V...>, int) -> decltype(S{std::declval<V>()..., {}}, std::true_type());
template <class S>
std::false_type takesMore(...);

}  // namespace Detail

/// The list of S, whose closing macro stands on the line `end`. S holds no more than an alias of
/// it, so it is instantiated when somebody asks, by when S is complete. Asked inside S it would
/// find no fields, and say so for good.
template <class S, int end>
class FieldList {
  static constexpr int first = end > Detail::span ? end - Detail::span : 1;

  // Counted first, because the array of the lines needs its size as a constant.
  template <int... offsets>
  static constexpr std::size_t countLines(std::integer_sequence<int, offsets...>) {
    constexpr bool has[] = {Detail::HasField<S, first + offsets>...};
    return static_cast<std::size_t>(std::count(std::begin(has), std::end(has), true));
  }

  // From the top down: the order of the lines is the order of the fields.
  template <int... offsets>
  static constexpr auto findLines(std::integer_sequence<int, offsets...> range) {
    constexpr bool has[] = {Detail::HasField<S, first + offsets>...};
    std::array<int, countLines(range)> found{};
    std::size_t n = 0;
    for (int i = 0; i < end - first; ++i) {
      if (has[i]) found[n++] = first + i;
    }
    return found;
  }

  static constexpr auto lines = findLines(std::make_integer_sequence<int, end - first>());

  template <std::size_t i>
  static constexpr auto onLine() {
    return S::template keelgateField<S>(static_cast<Detail::Line<lines[i]>*>(nullptr));
  }

  // A family is visited as the single fields that it stands for.
  template <class Visitor, class V>
  static constexpr void visit(Visitor& visitor, Field<S, V> field) {
    visitor(field);
  }
  template <class Visitor, class V, std::size_t n>
  static constexpr void visit(Visitor& visitor, const std::array<Field<S, V>, n>& family) {
    for (const auto& field : family) visitor(field);
  }

  template <class Visitor, std::size_t... i>
  static constexpr void eachOf(Visitor& visitor, std::index_sequence<i...>) {
    // An initialiser list and not a fold: clang nests folds at most 256 deep.
    const int sequence[] = {0, (visit(visitor, onLine<i>()), 0)...};
    static_cast<void>(sequence);
  }

  // The zero in front: a struct without fields would make an array without elements.
  template <std::size_t... i>
  static constexpr std::size_t total(std::index_sequence<i...>) {
    const std::size_t counts[] = {0, Detail::FieldCount<decltype(onLine<i>())>::value...};
    std::size_t sum = 0;
    for (std::size_t count : counts) sum += count;
    return sum;
  }

  using Lines = std::make_index_sequence<lines.size()>;

  template <std::size_t... i>
  static constexpr auto types(std::index_sequence<i...>) {
    return (Detail::Types<>() + ... + Detail::typesOf(onLine<i>()));
  }

  template <class Other, class Visitor, std::size_t... i>
  static constexpr void eachPair(Visitor& visitor, std::index_sequence<i...>) {
    const int sequence[] = {
        0, (static_cast<void>(visitor(onLine<i>(), Other::template onLine<i>())), 0)...};
    static_cast<void>(sequence);
  }

  template <class, int>
  friend class FieldList;

 public:
  /// In fields, with each member of a family counted.
  static constexpr std::size_t size = total(Lines());

  /// False when a member of S was declared without FIELD, or too far above the closing macro. The
  /// compiler is asked whether S can be made from as many values as there are fields, and cannot be
  /// made from one more. A walker that missed a member would drop it without a word.
  static constexpr bool isComplete() {
    using All = decltype(types(Lines()));
    return decltype(Detail::takes<S>(All(), 0))::value &&
           !decltype(Detail::takesMore<S>(All(), 0))::value;
  }

  /// Calls `visitor(field)` for every field in declaration order. At compile time or at run time.
  /// The field comes by value.
  template <class Visitor>
  static constexpr void each(Visitor&& visitor) {
    eachOf(visitor, Lines());
  }

  /// Calls `visitor(field, otherField)` for the fields of two lists of one length, neither of which
  /// has a numbered family. For the copies from schema to record, which agree position by position.
  template <class Other, class Visitor>
  static constexpr void eachWith(Other, Visitor&& visitor) {
    static_assert(size == Other::size && size == lines.size() && size == Other::lines.size());
    eachPair<Other>(visitor, Lines());
  }

  /// The names, and the keys, in declaration order. As arrays, for tables and comparisons that are
  /// made at compile time.
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

/// What is decoded from a message: a struct that closed its list with CODING_KEYS.
template <class T>
concept Schema = requires {
  typename T::CodingKeys;
};

/// What is handed to the client: a struct that closed its list with LABELS.
template <class T>
concept Record = requires {
  typename T::Labels;
};

/// Either kind of struct. None is both.
template <class T>
concept Described = Schema<T> || Record<T>;

namespace Detail {
template <class T>
struct FieldsOf;
template <Schema T>
struct FieldsOf<T> {
  using Type = typename T::CodingKeys;
};
template <Record T>
struct FieldsOf<T> {
  using Type = typename T::Labels;
};
}  // namespace Detail

/// The list of either, for walkers that do not care which it is.
template <Described T>
using FieldsOf = typename Detail::FieldsOf<T>::Type;

/// An enumeration whose cases each carry a record: a std::variant that knows its cases' names.
template <class T>
concept CaseKeyed = requires {
  T::caseNames;
};

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
