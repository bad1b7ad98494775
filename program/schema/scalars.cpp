// SPDX-License-Identifier: Apache-2.0
/// No value is rounded, cut or read as another type to make it fit: what a record says is what the
/// message said.
#include "program/schema/scalars.h"

#include "text/uuid.h"

#include <cmath>

namespace VespKeelgateService::Scalars {

using Keelgate::Bool;
using Keelgate::Data;
using Keelgate::Date;
using Keelgate::Double;
using Keelgate::Int64;
using Keelgate::String;
using Keelgate::UInt64;
using Keelgate::UUID;
using PropertyList::Integer;
using PropertyList::Type;

namespace {

void expect(Type type, const Value& value, const CodingPath& path, std::string_view expected) {
  if (value.type() != type) throw Errors::typeMismatch(path, expected, value.type());
}

}  // namespace

Int64 decodeSigned(const Value& value, const CodingPath& path, std::string_view expected) {
  expect(Type::integer, value, path, expected);
  const Integer integer = value.integer();
  const auto number = static_cast<Int64>(integer.bits);
  // From 2^63 on: read as signed it would turn negative.
  if (!integer.negative && number < 0) throw Errors::numberDoesNotFit(path, expected);
  return number;
}

UInt64 decodeUnsigned(const Value& value, const CodingPath& path, std::string_view expected) {
  expect(Type::integer, value, path, expected);
  const Integer integer = value.integer();
  if (integer.negative) throw Errors::numberDoesNotFit(path, expected);
  return integer.bits;
}

void decode(ExpansionBudget&, const Value& value, const CodingPath& path, Double& into) {
  if (value.type() == Type::real) {
    into = value.real();
    return;
  }
  expect(Type::integer, value, path, "Double");
  const Integer integer = value.integer();
  // Of the smallest number too, which has no positive form with a sign.
  const std::uint64_t magnitude = integer.negative ? 0 - integer.bits : integer.bits;
  const auto rounded = static_cast<double>(magnitude);
  // 2^64 itself is what the largest numbers round to, and is out of range for the way back.
  constexpr double beyond = 18446744073709551616.0;
  if (rounded >= beyond || static_cast<std::uint64_t>(rounded) != magnitude) {
    throw Errors::numberDoesNotFit(path, "Double");
  }
  into = integer.negative ? -rounded : rounded;
}

void decode(ExpansionBudget&, const Value& value, const CodingPath& path, Bool& into) {
  expect(Type::boolean, value, path, "Bool");
  into = value.boolean();
}

void decode(ExpansionBudget& budget, const Value& value, const CodingPath& path, String& into) {
  expect(Type::string, value, path, "String");
  const std::string_view text = value.string();
  // Before the copy: one long string may be referenced a million times.
  budget.spend(value, text.size());
  into = String(text);
}

void decode(ExpansionBudget& budget, const Value& value, const CodingPath& path, Data& into) {
  expect(Type::data, value, path, "Data");
  const PropertyList::Bytes bytes = value.data();
  budget.spend(value, bytes.size());
  into.assign(bytes.begin(), bytes.end());
}

void decode(ExpansionBudget&, const Value& value, const CodingPath& path, Date& into) {
  expect(Type::date, value, path, "Date");
  into.secondsSinceReferenceDate = value.date();
}

void decode(ExpansionBudget&, const Value& value, const CodingPath& path, UUID& into) {
  expect(Type::string, value, path, "UUID");
  const auto octets = Keelgate::Text::parseUuid(value.string());
  if (!octets) throw Errors::invalidUUID(path);
  into.octets = *octets;
}

}  // namespace VespKeelgateService::Scalars
