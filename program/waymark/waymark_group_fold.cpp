// SPDX-License-Identifier: Apache-2.0
/// Goes by the fields' names, which are the wire keys, so that the 124 numbered fields need no list
/// of their own that could differ from the schema's.
#include "program/waymark/waymark_group_fold.h"

#include "framework/contracts/construct.h"

#include <array>
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

/// Where a field of a check-in goes: to a field of a group, or nowhere.
struct Place {
  UInt group = 0;
  Optional<String> WaymarkGroupFields::*member = nullptr;
};

/// By the position of the field; made by the compiler.
constexpr auto places = [] {
  constexpr auto& names = WaymarkSchema::CodingKeys::names;
  std::array<Place, names.size()> all{};
  for (std::size_t i = 0; i < names.size(); ++i) {
    for (const Family& family : families) {
      if (!names[i].starts_with(family.prefix)) continue;
      // The unnumbered field is the first group, which lives in the message's own record.
      const Optional<UInt> number = groupNumber(names[i]);
      if (number) all[i] = {*number, family.member};
    }
  }
  return all;
}();

}  // namespace

Array<WaymarkGroupFields> foldGroups(WaymarkSchema& schema) {
  constexpr UInt first = 2;
  constexpr UInt last = 32;
  Array<WaymarkGroupFields> groups;
  groups.reserve(last - first + 1);
  for (UInt number = first; number <= last; ++number) {
    groups.push_back(Keelgate::construct<WaymarkGroupFields>({.groupNumber = number,
                                                              .receiverHandle = {},
                                                              .sharingInvitationData = {},
                                                              .shareURL = {},
                                                              .participantID = {}}));
  }
  std::size_t position = 0;
  WaymarkSchema::CodingKeys::each([&](auto field) {
    const Place& place = places[position++];
    // Always so for a field that has a place. The others only have to compile.
    if constexpr (std::same_as<typename decltype(field)::Value, Optional<String>>) {
      if (place.member == nullptr) return;
      groups[place.group - first].*place.member = std::move(schema.*field.member);
    }
  });
  return groups;
}

}  // namespace VespKeelgateService
