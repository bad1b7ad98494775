// SPDX-License-Identifier: Apache-2.0
/// From a schema to the record that agrees with it, told only what changes.
///
///     return construct(fieldByField<PulseUserPayload>(
///         std::move(schema), label<&PulseUserPayload::httpHeaders> = std::move(headers)));
///
/// The two lists are compared at compile time, position by position: they have the same length and
/// the same names in the same order, and a field whose type changes must be given by its label. A
/// field that moved, went missing or was forgotten does not compile.
///
/// A pure function; callable from any thread. Values are moved, so nothing throws.
#pragma once

#include <keelgate/describe.h>

#include <array>
#include <concepts>
#include <cstddef>
#include <string_view>
#include <tuple>
#include <utility>

namespace VespKeelgateService {

namespace Detail {

/// A value with the field that it is for.
template <auto member, class V>
struct Labelled {
  V value;
};

/// What stands to the left of the = in a call. The = makes a Labelled and assigns nothing.
template <auto member>
struct Label {
  template <class V>
  constexpr auto operator=(V&& value) const {
    return Labelled<member, std::decay_t<V>>{std::forward<V>(value)};
  }
};

/// The types of the fields' values, each spelt as the compiler has it. Not the addresses of
/// objects: under a sanitizer those are no constants that can be compared.
template <class S>
constexpr auto typeTags() {
  std::array<std::string_view, Keelgate::FieldsOf<S>::size> tags{};
  std::size_t n = 0;
  Keelgate::FieldsOf<S>::each([&](auto field) {
    tags[n++] = Keelgate::Detail::prettyFunction<typename decltype(field)::Value>();
  });
  return tags;
}

/// Also their order: swapped fields of one type would otherwise be copied crosswise.
template <class S, class R>
consteval bool namesAgree() {
  return Keelgate::FieldsOf<S>::names == Keelgate::FieldsOf<R>::names;
}

/// Pointers to members of different types cannot be compared, and are never the same.
template <class A, class B>
constexpr bool isSameMember(A one, B other) {
  if constexpr (std::same_as<A, B>) {
    return one == other;
  } else {
    return false;
  }
}

/// Of each position, whether the two fields have one type.
template <class S, class R>
constexpr auto sameTypes() {
  const auto from = typeTags<S>();
  const auto to = typeTags<R>();
  std::array<bool, Keelgate::FieldsOf<R>::size> same{};
  for (std::size_t i = 0; i < same.size(); ++i) same[i] = from[i] == to[i];
  return same;
}

/// Whether every field whose type changes has a label. A label may stand on a field whose type
/// agrees, too: then it replaces the value.
template <class S, class R, auto... members>
consteval bool changesAreLabelled() {
  const auto same = sameTypes<S, R>();
  bool all = true;
  std::size_t n = 0;
  Keelgate::FieldsOf<R>::each([&]([[maybe_unused]] auto field) {
    all = all && (same[n++] || ... || isSameMember(members, field.member));
  });
  return all;
}

}  // namespace Detail

/// `label<&Record::field> = value` gives one field, in place of the schema's.
template <auto member>
inline constexpr Detail::Label<member> label{};

/// Every field of the record comes from the schema or from a change, never from neither.
template <class R, class S, auto... members, class... V>
R fieldByField(S&& schema, Detail::Labelled<members, V>... changes) {
  static_assert(!std::is_lvalue_reference_v<S>, "fieldByField consumes its schema: move it");
  using From = Keelgate::FieldsOf<S>;
  using To = Keelgate::FieldsOf<R>;
  static_assert(From::size == To::size,
                "fieldByField: the schema and the record have different numbers of fields");
  if constexpr (From::size == To::size) {
    static_assert(Detail::namesAgree<S, R>(),
                  "fieldByField: a field of the record has another name than the schema's field "
                  "at its position");
    static_assert(Detail::changesAreLabelled<S, R, members...>(),
                  "fieldByField: a field changes its type on the way and has no label");
  }
  // Where the schema's values are, by position. Only those whose type is the same on both sides are
  // looked at again, as what they are.
  std::array<void*, From::size> values{};
  std::size_t n = 0;
  From::each([&](auto field) { values[n++] = &(schema.*field.member); });
  constexpr auto same = Detail::sameTypes<S, R>();
  R record{};
  n = 0;
  To::each([&](auto field) {
    using Value = typename decltype(field)::Value;
    if (same[n]) record.*field.member = std::move(*static_cast<Value*>(values[n]));
    ++n;
  });
  ((record.*members = std::move(changes.value)), ...);
  return record;
}

}  // namespace VespKeelgateService
