// SPDX-License-Identifier: Apache-2.0
/// Goes by the fields' names, which are the wire keys, so that the 124 numbered fields need no list
/// of their own that could differ from the schema's.
#include "program/waymark/waymark_group_fold.h"

#include "framework/contracts/construct.h"
#include "program/schema/fields_into.h"

#include <array>
#include <iterator>
#include <string_view>
#include <utility>

namespace VespKeelgateService {

using Keelgate::WaymarkGroupFields;

namespace {

/// A prefix, and where the group's record keeps it. No name begins with two of them.
struct Family {
  std::string_view prefix;
  Optional<String> WaymarkGroupFields::*member;
};

constexpr Family families[] = {
    {"receiverHandle", &WaymarkGroupFields::receiverHandle},
    {"sharingInvitationData", &WaymarkGroupFields::sharingInvitationData},
    {"shareURL", &WaymarkGroupFields::shareURL},
    {"participantID", &WaymarkGroupFields::participantID},
};

constexpr bool isDigit(char c) {
  return c >= '0' && c <= '9';
}

/// The number at the end of a field's name; the unnumbered field of a family has none.
constexpr Optional<UInt> groupNumber(std::string_view name) {
  std::size_t digits = name.size();
  while (digits > 0 && isDigit(name[digits - 1])) --digits;
  if (digits == name.size()) return std::nullopt;
  UInt number = 0;
  for (char c : name.substr(digits)) number = number * 10 + static_cast<UInt>(c - '0');
  return number;
}

/// Where a numbered field of a check-in goes: from the schema to a field of a group.
struct Place {
  Optional<String> WaymarkSchema::*from = nullptr;
  UInt group = 0;
  Optional<String> WaymarkGroupFields::*to = nullptr;
};

constexpr UInt first = 2;
constexpr UInt last = 32;

/// In the order of the fields; made by the compiler.
constexpr auto places = [] {
  constexpr auto& names = WaymarkSchema::CodingKeys::names;
  std::array<Place, (last - first + 1) * std::size(families)> all{};
  std::size_t count = 0;
  for (std::size_t i = 0; i < names.size(); ++i) {
    for (const Family& family : families) {
      if (!names[i].starts_with(family.prefix)) continue;
      // The unnumbered field is the first group, which lives in the message's own record.
      const Optional<UInt> number = groupNumber(names[i]);
      if (!number) continue;
      all.at(count++) = {membersOf<WaymarkSchema, Optional<String>>[i], *number, family.member};
    }
  }
  return all;
}();
static_assert(places.back().to != nullptr, "there are fewer numbered fields than groups have");

}  // namespace

Array<WaymarkGroupFields> foldGroups(WaymarkSchema& schema) {
  Array<WaymarkGroupFields> groups(last - first + 1);
  for (UInt number = first; number <= last; ++number) groups[number - first].groupNumber = number;
  for (const Place& place : places) {
    Optional<String>& text = schema.*place.from;
    if (text) groups[place.group - first].*place.to = std::move(text);
  }
  Keelgate::constructInPlace(groups);
  return groups;
}

}  // namespace VespKeelgateService
