// SPDX-License-Identifier: Apache-2.0
/// The single values of a property list as the types that fields have: no conversions but the ones
/// that are listed with each.
///
/// Pure but for the budget, which belongs to one decoding. Each throws DecodingError with `path`,
/// and MalformedDocument where the budget is used up.
#pragma once

#include "plist/document.h"
#include "plist/expansion_budget.h"
#include "program/schema/coding_path.h"
#include "program/schema/decoding_errors.h"

#include <keelgate/describe.h>

#include <string_view>

namespace VespKeelgateService::Scalars {

using PropertyList::ExpansionBudget;
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

/// An integer fills any integer field that it fits in. A real or a boolean never does.
Keelgate::Int64 decodeSigned(const Value& value, const CodingPath& path, std::string_view expected);
Keelgate::UInt64 decodeUnsigned(const Value& value, const CodingPath& path,
                                std::string_view expected);

/// Numbers have a fixed size and are part of what their record was paid for: no budget is asked.
inline void decode(ExpansionBudget&, const Value& value, const CodingPath& path,
                   Keelgate::Int& into) {
  into = static_cast<Keelgate::Int>(decodeSigned(value, path, "Int"));
}
inline void decode(ExpansionBudget&, const Value& value, const CodingPath& path,
                   Keelgate::Int64& into) {
  into = decodeSigned(value, path, "Int64");
}
inline void decode(ExpansionBudget&, const Value& value, const CodingPath& path,
                   Keelgate::UInt& into) {
  into = static_cast<Keelgate::UInt>(decodeUnsigned(value, path, "UInt"));
}
inline void decode(ExpansionBudget&, const Value& value, const CodingPath& path,
                   Keelgate::UInt64& into) {
  into = decodeUnsigned(value, path, "UInt64");
}

/// A real, or an integer that a double holds exactly.
void decode(ExpansionBudget& budget, const Value& value, const CodingPath& path,
            Keelgate::Double& into);
void decode(ExpansionBudget& budget, const Value& value, const CodingPath& path,
            Keelgate::Bool& into);
void decode(ExpansionBudget& budget, const Value& value, const CodingPath& path,
            Keelgate::String& into);
void decode(ExpansionBudget& budget, const Value& value, const CodingPath& path,
            Keelgate::Data& into);
void decode(ExpansionBudget& budget, const Value& value, const CodingPath& path,
            Keelgate::Date& into);
/// A string of the form 8-4-4-4-12 hexadecimal digits, in either case.
void decode(ExpansionBudget& budget, const Value& value, const CodingPath& path,
            Keelgate::UUID& into);

/// An integer that is one of the enumeration's raw values. A negative integer is none of them,
/// rather than one that is out of range.
template <Keelgate::Enumeration E>
void decode(ExpansionBudget&, const Value& value, const CodingPath& path, E& into) {
  const Keelgate::Optional<Keelgate::UInt64> number =
      PropertyList::Type::integer == value.type() && value.integer().negative
          ? Keelgate::Optional<Keelgate::UInt64>()
          : decodeUnsigned(value, path, Keelgate::typeName<E>());
  const Keelgate::Optional<E> known =
      number ? Keelgate::fromRawValue<E>(*number) : Keelgate::Optional<E>();
  if (!known) throw Errors::invalidRawValue(path, Keelgate::typeName<E>());
  into = *known;
}

}  // namespace VespKeelgateService::Scalars
