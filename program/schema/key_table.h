// SPDX-License-Identifier: Apache-2.0
/// The wire keys of a schema as a document's reader knows them: a key's position is its field's
/// place in the order by type.
///
/// Made by the compiler; constants, usable from any thread.
#pragma once

#include "framework/contracts/fields.h"
#include "plist/known_keys.h"

#include <keelgate/describe.h>

#include <algorithm>

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
  static constexpr PropertyList::KnownKeysTable<S::CodingKeys::size> table{
      S::CodingKeys::keys, Keelgate::byType<S>.positions};
};

template <Keelgate::Schema S>
constexpr PropertyList::KnownKeys knownKeys = KeyTable<S>::table.of(S::CodingKeys::keys,
                                                                    Keelgate::byType<S>.positions);

}  // namespace VespKeelgateService
