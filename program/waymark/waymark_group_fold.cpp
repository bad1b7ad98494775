// SPDX-License-Identifier: Apache-2.0
/// Goes by the fields' names, which are the wire keys, so that the 124 numbered fields need no list
/// of their own that could differ from the schema's.
#include "program/waymark/waymark_group_fold.h"

#include "framework/contracts/construct.h"

#include <map>
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
Optional<UInt> groupNumber(std::string_view name) {
  std::size_t digits = name.size();
  while (digits > 0 && isDigit(name[digits - 1])) --digits;
  if (digits == name.size()) return std::nullopt;
  UInt number = 0;
  for (char c : name.substr(digits)) number = number * 10 + static_cast<UInt>(c - '0');
  return number;
}

class GroupMap {
 public:
  template <class V>
  void visit(std::string_view name, V& value) {
    for (const Family& family : families) {
      if (!name.starts_with(family.prefix)) continue;
      const Optional<UInt> number = groupNumber(name);
      // The unnumbered field is the first group, which lives in the message's own record.
      if (!number) continue;
      // Always so for a numbered field. The others only have to compile.
      if constexpr (std::same_as<V, Optional<String>>) {
        group(*number).*family.member = std::move(value);
      }
    }
  }

  Array<WaymarkGroupFields> values() && {
    Array<WaymarkGroupFields> values;
    values.reserve(groups_.size());
    for (auto& [number, group] : groups_) values.push_back(std::move(group));
    return values;
  }

 private:
  // Made at the first sight of its number, value or not: every message gives all 31.
  WaymarkGroupFields& group(UInt number) {
    const auto known = groups_.find(number);
    if (known != groups_.end()) return known->second;
    auto empty = Keelgate::construct<WaymarkGroupFields>({.groupNumber = number,
                                                          .receiverHandle = {},
                                                          .sharingInvitationData = {},
                                                          .shareURL = {},
                                                          .participantID = {}});
    return groups_.emplace(number, std::move(empty)).first->second;
  }

  std::map<UInt, WaymarkGroupFields> groups_;
};

}  // namespace

Array<WaymarkGroupFields> foldGroups(WaymarkSchema& schema) {
  GroupMap groups;
  WaymarkSchema::CodingKeys::each(
      [&](auto field) { groups.visit(field.name, schema.*field.member); });
  return std::move(groups).values();
}

}  // namespace VespKeelgateService
