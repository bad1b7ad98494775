// SPDX-License-Identifier: Apache-2.0
/// Records as JSON, walked from their one description: a new record needs no line here.
///
/// A record is an object with the fields under their labels, in their order; an absent value is
/// left out; an enumeration whose case carries a record is an object with that one key.
///
/// Throws what the Writer throws.
#pragma once

#include "framework/json/writer.h"

#include <keelgate/describe.h>
#include <keelgate/records.h>

#include <concepts>
#include <string_view>
#include <variant>

namespace Keelgate::JSON {

/// RFC 3339 in UTC, rounded to microseconds; outside the years 1 to 9999 the number of seconds
/// since 2001-01-01T00:00:00Z.
void write(Writer& out, Date date);
/// Upper-case.
void write(Writer& out, const UUID& uuid);
/// As the value that it is: an object, an array (of a set too), a string, a number, {"uid": N}.
void write(Writer& out, const PropertyListValue& value);
/// {"type": T, "value": V} for each value of the tree, so that nothing is lost.
void writeTyped(Writer& out, const PropertyListValue& value);

/// Any value that a record can hold, records included.
template <class T>
void write(Writer& out, const T& value);

/// The records that are not an object of their fields, but the one field: a case, a tree.
template <class T>
constexpr Bool isItsField =
    std::same_as<T, VespClientMessageResult> || std::same_as<T, PropertyList>;

/// A member with its value; none where the value is absent. The name has nothing to escape in it.
///
/// Deliberate: apart, or the visitor of a struct with 156 fields, most of which are absent, would
/// have to make room on the stack for each.
template <class T>
[[gnu::noinline]] void writeField(Writer& out, std::string_view name, const T& value) {
  out.label(name);
  write(out, value);
}

template <class T>
void writeField(Writer& out, std::string_view name, const Optional<T>& value) {
  if (value) writeField(out, name, *value);
}

template <class T>
void writeArray(Writer& out, const Array<T>& values) {
  out.beginArray();
  for (const T& value : values) write(out, value);
  out.endArray();
}

template <class T>
void writeObject(Writer& out, const T& value) {
  out.beginObject();
  if constexpr (CaseKeyed<T>) {
    std::visit([&](const auto& payload) { writeField(out, T::caseNames[value.index()], payload); },
               value);
  } else {
    FieldsOf<T>::each([&](auto field) { writeField(out, field.name, value.*field.member); });
  }
  out.endObject();
}

template <class T>
void write(Writer& out, const T& value) {
  if constexpr (std::same_as<T, Bool>) {
    out.raw(value ? "true" : "false");
  } else if constexpr (std::signed_integral<T>) {
    out.integer(Int64{value});
  } else if constexpr (std::unsigned_integral<T>) {
    out.integer(UInt64{value});
  } else if constexpr (Enumeration<T>) {
    out.string(nameOf(value));
  } else if constexpr (std::same_as<T, Double>) {
    out.number(value);
  } else if constexpr (std::convertible_to<T, std::string_view>) {
    out.string(value);
  } else if constexpr (std::same_as<T, Data>) {
    out.data(value);
  } else if constexpr (isItsField<T>) {
    FieldsOf<T>::each([&](auto field) { write(out, value.*field.member); });
  } else if constexpr (isArray<T>) {
    writeArray(out, value);
  } else {
    writeObject(out, value);
  }
}

}  // namespace Keelgate::JSON
