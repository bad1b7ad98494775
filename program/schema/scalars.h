// SPDX-License-Identifier: Apache-2.0
/// The single values of a property list as the types that fields have: no conversions but the ones
/// that are listed with each. No value is rounded, cut or read as another type to make it fit: what
/// a record says is what the message said.
///
/// Pure but for the budget, which belongs to one decoding. Each tells what is wrong with a value,
/// and throws MalformedDocument where the budget is used up. An error is made apart, by `refuse`:
/// where a value stands is told only where something is wrong with it.
#pragma once

#include "plist/document.h"
#include "plist/expansion_budget.h"
#include "program/schema/coding_path.h"
#include "program/schema/decoding_errors.h"

#include <keelgate/describe.h>

#include <concepts>
#include <string_view>
#include <utility>

namespace VespKeelgateService::Scalars {

using PropertyList::ExpansionBudget;
using PropertyList::Type;
using PropertyList::Value;

/// What an error says was expected.
template <class T>
constexpr std::string_view expectation() {
  if constexpr (std::same_as<T, Keelgate::Int>)
    return "Int";
  else if constexpr (std::same_as<T, Keelgate::UInt>)
    return "UInt";
  else if constexpr (std::same_as<T, Keelgate::Int64>)
    return "Int64";
  else if constexpr (std::same_as<T, Keelgate::UInt64>)
    return "UInt64";
  else if constexpr (std::same_as<T, Keelgate::Double>)
    return "Double";
  else if constexpr (std::same_as<T, Keelgate::Bool>)
    return "Bool";
  else if constexpr (std::same_as<T, Keelgate::String>)
    return "String";
  else if constexpr (std::same_as<T, Keelgate::Data>)
    return "Data";
  else if constexpr (Keelgate::isArray<T>)
    return "an array";
  else
    return Keelgate::typeName<T>();
}

enum class Fault { none, otherType, doesNotFit, noRawValue, noUuid };

/// Throws the DecodingError for a value of the type `found` at `path`.
[[noreturn]] void refuse(Fault fault, const CodingPath& path, std::string_view expected,
                         Type found);
/// The same for what stands under a key.
[[noreturn]] void refuse(Fault fault, const CodingPath& outer, std::string_view key,
                         std::string_view expected, Type found);

/// An integer fills any integer field that it fits in. A real or a boolean never does. Numbers have
/// a fixed size and are part of what their record was paid for: no budget is asked.
template <std::integral T>
Fault decode(ExpansionBudget&, Value value, T& into) {
  if (value.type() != Type::integer) return Fault::otherType;
  const PropertyList::Integer integer = value.integer();
  into = static_cast<T>(integer.bits);
  // Read as signed, a number from 2^63 on would turn negative.
  const bool fits = std::signed_integral<T> ? integer.negative == (into < 0) : !integer.negative;
  return fits ? Fault::none : Fault::doesNotFit;
}

inline Fault decode(ExpansionBudget&, Value value, Keelgate::Bool& into) {
  if (value.type() != Type::boolean) return Fault::otherType;
  into = value.boolean();
  return Fault::none;
}

/// A real, or an integer that a double holds exactly.
Fault decodeInteger(PropertyList::Integer integer, Keelgate::Double& into);
inline Fault decode(ExpansionBudget&, Value value, Keelgate::Double& into) {
  if (value.type() == Type::integer) return decodeInteger(value.integer(), into);
  if (value.type() != Type::real) return Fault::otherType;
  into = value.real();
  return Fault::none;
}

inline Fault decode(ExpansionBudget&, Value value, Keelgate::Date& into) {
  if (value.type() != Type::date) return Fault::otherType;
  into.secondsSinceReferenceDate = value.date();
  return Fault::none;
}

/// Texts and data are made where they stay.
inline Fault decode(ExpansionBudget& budget, Value value,
                    Keelgate::Optional<Keelgate::String>& into) {
  if (value.type() != Type::string) return Fault::otherType;
  const std::string_view text = value.string();
  // Before the copy: one long string may be referenced a million times.
  budget.spend(value, text.size());
  into.emplace(text);
  return Fault::none;
}

inline Fault decode(ExpansionBudget& budget, Value value,
                    Keelgate::Optional<Keelgate::Data>& into) {
  if (value.type() != Type::data) return Fault::otherType;
  const PropertyList::Bytes bytes = value.data();
  budget.spend(value, bytes.size());
  into.emplace(bytes.begin(), bytes.end());
  return Fault::none;
}

template <class T>
requires std::same_as<T, Keelgate::String> || std::same_as<T, Keelgate::Data> Fault
decode(ExpansionBudget& budget, Value value, T& into) {
  Keelgate::Optional<T> made;
  const Fault fault = decode(budget, value, made);
  if (fault == Fault::none) into = std::move(*made);
  return fault;
}

/// A string of the form 8-4-4-4-12 hexadecimal digits, in either case.
Fault decode(ExpansionBudget& budget, Value value, Keelgate::UUID& into);

/// An integer that is one of the enumeration's raw values. A negative integer is none of them,
/// rather than one that is out of range.
template <Keelgate::Enumeration E>
Fault decode(ExpansionBudget&, Value value, E& into) {
  if (value.type() != Type::integer) return Fault::otherType;
  const PropertyList::Integer integer = value.integer();
  const Keelgate::Optional<E> known = Keelgate::fromRawValue<E>(integer.bits);
  if (integer.negative || !known) return Fault::noRawValue;
  into = *known;
  return Fault::none;
}

template <class T>
Fault decode(ExpansionBudget& budget, Value value, Keelgate::Optional<T>& into) {
  return decode(budget, value, into.emplace());
}

}  // namespace VespKeelgateService::Scalars
