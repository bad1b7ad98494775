// SPDX-License-Identifier: Apache-2.0
/// A check-in whose numbered recipient fields are decoded where the record has them: in one record
/// for each group.
///
/// Goes by the fields' names, which are the wire keys, so that the 124 numbered fields need no list
/// of their own that could differ from the schema's.
#pragma once

#include "program/schema/fields_into.h"
#include "program/waymark/waymark_schema.h"
#include "text/ascii.h"

#include <keelgate/records/waymark_message.h>

#include <algorithm>
#include <array>
#include <iterator>
#include <string_view>

namespace VespKeelgateService {

/// Has the groups 2 to 32, each exactly once, also where all their fields are absent. The numbered
/// fields of the schema stay empty.
struct FoldedCheckIn {
  WaymarkSchema fields{};
  Array<Keelgate::WaymarkGroupFields> groups = numberedGroups();

  static constexpr UInt first = 2;
  static constexpr UInt last = 32;
  static Array<Keelgate::WaymarkGroupFields> numberedGroups() {
    Array<Keelgate::WaymarkGroupFields> groups(last - first + 1);
    for (UInt number = first; number <= last; ++number) groups[number - first].groupNumber = number;
    return groups;
  }
};

namespace Fold {

/// A prefix, and where the group's record keeps it. No name begins with two of them.
struct Family {
  std::string_view prefix;
  Optional<String> Keelgate::WaymarkGroupFields::*member;
};

inline constexpr Family families[] = {
    {"receiverHandle", &Keelgate::WaymarkGroupFields::receiverHandle},
    {"sharingInvitationData", &Keelgate::WaymarkGroupFields::sharingInvitationData},
    {"shareURL", &Keelgate::WaymarkGroupFields::shareURL},
    {"participantID", &Keelgate::WaymarkGroupFields::participantID},
};

/// The number at the end of a field's name; the unnumbered field of a family has none.
constexpr Optional<UInt> groupNumber(std::string_view name) {
  std::size_t digits = name.size();
  while (digits > 0 && Keelgate::Text::isDigit(name[digits - 1])) --digits;
  if (digits == name.size()) return std::nullopt;
  UInt number = 0;
  for (char c : name.substr(digits)) number = number * 10 + static_cast<UInt>(c - '0');
  return number;
}

/// Where a numbered field of a check-in goes. Null for the others.
struct Place {
  UInt group = 0;
  Optional<String> Keelgate::WaymarkGroupFields::*to = nullptr;
};

/// By the position of the field; made by the compiler.
inline constexpr auto places = [] {
  constexpr auto& names = WaymarkSchema::CodingKeys::names;
  std::array<Place, WaymarkSchema::CodingKeys::size> all{};
  for (std::size_t i = 0; i < names.size(); ++i) {
    for (const Family& family : families) {
      if (!names[i].starts_with(family.prefix)) continue;
      // The unnumbered field is the first group, which lives in the message's own record.
      const Optional<UInt> number = groupNumber(names[i]);
      if (number) all[i] = {*number - FoldedCheckIn::first, family.member};
    }
  }
  return all;
}();
static_assert(std::ranges::count_if(places,
                                    [](const Place& place) { return place.to != nullptr; }) ==
                  (FoldedCheckIn::last - FoldedCheckIn::first + 1) * std::size(families),
              "not every group has all of its fields");

}  // namespace Fold

template <>
struct Places<FoldedCheckIn> {
  using Listed = WaymarkSchema;
  template <class V>
  static V& at(FoldedCheckIn& checkIn, std::size_t position) {
    if constexpr (std::same_as<V, Optional<String>>) {
      const Fold::Place& place = Fold::places.data()[position];
      if (place.to != nullptr) return checkIn.groups[place.group].*place.to;
    }
    return checkIn.fields.*membersOf<WaymarkSchema, V>[position];
  }
};

}  // namespace VespKeelgateService
