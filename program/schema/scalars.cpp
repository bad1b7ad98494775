// SPDX-License-Identifier: Apache-2.0
#include "program/schema/scalars.h"

#include "text/uuid.h"

namespace VespKeelgateService::Scalars {

void refuse(Fault fault, const CodingPath& path, std::string_view expected, Type found) {
  if (found == Type::null) throw Errors::valueNotFound(path, expected);
  if (fault == Fault::doesNotFit) throw Errors::numberDoesNotFit(path, expected);
  if (fault == Fault::noRawValue) throw Errors::invalidRawValue(path, expected);
  if (fault == Fault::noUuid) throw Errors::invalidUUID(path);
  throw Errors::typeMismatch(path, expected, found);
}

void refuse(Fault fault, const CodingPath& outer, std::string_view key, std::string_view expected,
            Type found) {
  refuse(fault, CodingPath(outer, key), expected, found);
}

Fault decodeInteger(PropertyList::Integer integer, Keelgate::Double& into) {
  // Of the smallest number too, which has no positive form with a sign.
  const std::uint64_t magnitude = integer.negative ? 0 - integer.bits : integer.bits;
  const auto rounded = static_cast<double>(magnitude);
  // 2^64 itself is what the largest numbers round to, and is out of range for the way back.
  constexpr double beyond = 18446744073709551616.0;
  if (rounded >= beyond || static_cast<std::uint64_t>(rounded) != magnitude) {
    return Fault::doesNotFit;
  }
  into = integer.negative ? -rounded : rounded;
  return Fault::none;
}

Fault decode(ExpansionBudget&, Value value, Keelgate::UUID& into) {
  if (value.type() != Type::string) return Fault::otherType;
  const auto octets = Keelgate::Text::parseUuid(value.string());
  if (!octets) return Fault::noUuid;
  into.octets = *octets;
  return Fault::none;
}

}  // namespace VespKeelgateService::Scalars
