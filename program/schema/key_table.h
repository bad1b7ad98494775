// SPDX-License-Identifier: Apache-2.0
/// The wire keys of a schema as a document's reader knows them: a key's position is its field's
/// place in the order by type.
///
/// Made by the compiler; constants, usable from any thread.
#pragma once

#include "framework/contracts/fields_by_type.h"
#include "plist/known_keys.h"

#include <keelgate/describe.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <string_view>

namespace VespKeelgateService {

template <Keelgate::Schema S>
class KeyTable {
  static consteval bool keysAreDistinct() {
    auto sorted = S::CodingKeys::keys;
    std::sort(sorted.begin(), sorted.end());
    return std::adjacent_find(sorted.begin(), sorted.end()) == sorted.end();
  }
  static_assert(S::CodingKeys::isComplete(), "a member of the schema is not in its list of fields");
  static_assert(keysAreDistinct(), "two fields of a schema travel under one wire key");

 public:
  static constexpr auto keys = [] {
    std::array<std::string_view, S::CodingKeys::size> all{};
    for (std::size_t i = 0; i < all.size(); ++i) {
      all[i] = S::CodingKeys::keys[Keelgate::byType<S>.positions[i]];
    }
    return all;
  }();
  static constexpr PropertyList::KnownKeysTable<S::CodingKeys::size> table{keys};
};

template <Keelgate::Schema S>
constexpr PropertyList::KnownKeys knownKeys = KeyTable<S>::table.of(KeyTable<S>::keys);

}  // namespace VespKeelgateService
