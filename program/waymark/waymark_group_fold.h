// SPDX-License-Identifier: Apache-2.0
/// A check-in whose fields are decoded where the record has them: each in the member with its name,
/// the numbered ones in the record of their group.
///
/// Goes by the fields' names, which are the wire keys, so that the 153 fields need no list of their
/// own that could differ from the schema's.
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

/// The fields that the record has as enumerations. Plain numbers until all is decoded.
struct WaymarkCodes {
  KEELGATE_SCHEMA(WaymarkCodes,
      (UInt, messageType),
      (Optional<UInt>, sessionType),
      (Optional<UInt>, sessionDestinationType),
      (Optional<UInt>, lowPowerModeWarningState),
      (Optional<UInt>, referenceFrame),
      (Optional<UInt>, triggerType));
};

/// Has the groups 2 to 32, each exactly once, also where all their fields are absent. The codes of
/// the message are not set.
struct FoldedCheckIn {
  static constexpr UInt first = 2;
  static constexpr UInt last = 32;

  Keelgate::WaymarkMessage message{};
  WaymarkCodes codes{};

  FoldedCheckIn() {
    // As copies of one: others would have all their bytes set to zero first.
    auto& groups = message.groupFields.emplace(last - first + 1, Keelgate::WaymarkGroupFields{});
    for (UInt number = first; number <= last; ++number) groups[number - first].groupNumber = number;
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
inline constexpr auto numbered = [] {
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

/// The members of T that are of type V, by the position of the check-in's field with their name.
template <class T, class V>
constexpr auto namesakes = [] {
  constexpr auto& names = WaymarkSchema::CodingKeys::names;
  std::array<V T::*, WaymarkSchema::CodingKeys::size> members{};
  Keelgate::FieldsOf<T>::each([&]<class Value>(Keelgate::Field<T, Value> field) {
    if constexpr (std::same_as<Value, V>) {
      const auto name = std::ranges::find(names, field.name);
      members.at(static_cast<std::size_t>(name - names.begin())) = field.member;
    }
  });
  return members;
}();

constexpr bool everyFieldHasOnePlace() {
  std::size_t position = 0;
  bool isSo = true;
  WaymarkSchema::CodingKeys::each([&]<class V>(Keelgate::Field<WaymarkSchema, V>) {
    const int places = (numbered[position].to != nullptr) +
                       (namesakes<Keelgate::WaymarkMessage, V>[position] != nullptr) +
                       (namesakes<WaymarkCodes, V>[position] != nullptr);
    isSo = isSo && places == 1;
    ++position;
  });
  return isSo;
}
static_assert(everyFieldHasOnePlace(), "a field of the check-in has no place, or two");
constexpr std::size_t numberedFields =
    (FoldedCheckIn::last - FoldedCheckIn::first + 1) * std::size(families);
static_assert(std::ranges::count_if(numbered,
                                    [](const Place& place) { return place.to != nullptr; }) ==
                  numberedFields,
              "not every group has all of its fields");
// A record is looked up without a check.
static_assert(std::ranges::all_of(numbered,
                                  [](const Place& place) {
                                    return place.group <=
                                           FoldedCheckIn::last - FoldedCheckIn::first;
                                  }),
              "a numbered field has no group");
// The list of groups is the record's alone.
static_assert(WaymarkSchema::CodingKeys::size - numberedFields + 1 ==
                  Keelgate::FieldsOf<Keelgate::WaymarkMessage>::size,
              "a field of the record is not in the schema");

}  // namespace Fold

template <>
struct Places<FoldedCheckIn> {
  using Listed = WaymarkSchema;
  template <class V>
  static V& at(FoldedCheckIn& checkIn, std::size_t position) {
    using Keelgate::WaymarkMessage;
    if constexpr (std::same_as<V, Optional<String>>) {
      const Fold::Place& place = Fold::numbered.data()[position];
      // All groups are there from the start.
      if (place.to != nullptr) return checkIn.message.groupFields->data()[place.group].*place.to;
    }
    if constexpr (std::same_as<V, UInt> || std::same_as<V, Optional<UInt>>) {
      const auto code = Fold::namesakes<WaymarkCodes, V>.data()[position];
      if (code != nullptr) return checkIn.codes.*code;
    }
    return checkIn.message.*Fold::namesakes<WaymarkMessage, V>.data()[position];
  }
};

}  // namespace VespKeelgateService
