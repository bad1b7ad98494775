// SPDX-License-Identifier: Apache-2.0
/// The mirror of keyed decoding: a schema as the property list that it would be decoded from.
///
/// Fields are written under their wire keys in declaration order; absent ones are left out. The
/// service never encodes and does not link this. Tests and tools do, because every schema then has
/// a writer that cannot disagree with its reader.
///
/// Deliberate: an enumeration with payloads is written in its case-keyed form, {case: {"_0": …}}.
/// An invitation's context is not decoded from that form, so it does not come back as it was.
#pragma once

#include "plist/tree.h"
#include "text/uuid.h"

#include <keelgate/describe.h>

#include <concepts>
#include <string>
#include <utility>
#include <variant>

namespace VespKeelgateService {

/// Pure; callable from any thread. Throws std::bad_alloc.
template <class T>
PropertyList::Tree mirror(const T& value) {
  if constexpr (Keelgate::Enumeration<T>) {
    // As a signed number, which every raw value fits.
    return static_cast<std::int64_t>(value);
  } else if constexpr (std::same_as<T, Keelgate::Date>) {
    return PropertyList::Date{value.secondsSinceReferenceDate};
  } else if constexpr (std::same_as<T, Keelgate::UUID>) {
    return Keelgate::Text::uuidText(value.octets);
  } else if constexpr (Keelgate::isArray<T>) {
    PropertyList::Array elements;
    for (const auto& element : value) elements.push_back(mirror(element));
    return elements;
  } else if constexpr (Keelgate::CaseKeyed<T>) {
    PropertyList::Tree payload =
        std::visit([](const auto& schema) { return mirror(schema); }, value);
    PropertyList::Dictionary body{{"_0", std::move(payload)}};
    return PropertyList::Dictionary{{std::string(T::caseNames[value.index()]), std::move(body)}};
  } else if constexpr (Keelgate::Schema<T>) {
    PropertyList::Dictionary entries;
    T::CodingKeys::each([&](auto field) {
      const auto& member = value.*field.member;
      if constexpr (Keelgate::isOptional<typename decltype(field)::Value>) {
        if (member) entries.emplace_back(field.key, mirror(*member));
      } else {
        entries.emplace_back(field.key, mirror(member));
      }
    });
    return entries;
  } else {
    return value;
  }
}

}  // namespace VespKeelgateService
