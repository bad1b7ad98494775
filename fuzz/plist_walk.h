// SPDX-License-Identifier: Apache-2.0
// Walks all of a document into a tree, as a reader that pays for what it copies; shared by the
// fuzz harnesses and the tests of plist/.
#pragma once

#include <cmath>
#include <limits>
#include <string>

#include "plist/document.h"
#include "plist/expansion_budget.h"
#include "plist/tree.h"

namespace PropertyList {

Tree treeOf(const Value& value, ExpansionBudget& budget);

inline Array elementsOf(const Value& value, ExpansionBudget& budget) {
  Array elements;
  for (const Value element : value.elements()) elements.push_back(treeOf(element, budget));
  return elements;
}

inline Dictionary entriesOf(const Value& value, ExpansionBudget& budget) {
  Dictionary entries;
  for (const Entry entry : value.entries()) {
    budget.spend(value, entry.key.size() + 1);
    entries.emplace_back(std::string(entry.key), treeOf(entry.value, budget));
  }
  return entries;
}

// Throws Damage when sharing makes the tree too large. Depth is at most 512, as Document checks.
// UIDs become 0: they have no accessor, because no field takes one.
inline Tree treeOf(const Value& value, ExpansionBudget& budget) {
  budget.spend(value, sizeof(Tree));
  switch (value.type()) {
    case Type::null:
      return nullptr;
    case Type::boolean:
      return value.boolean();
    case Type::integer: {
      const Integer integer = value.integer();
      if (integer.bits >> 63 != 0 && !integer.negative) return integer.bits;
      return static_cast<std::int64_t>(integer.bits);
    }
    // One NaN stands for all, and one zero date for both: XML does not tell them apart.
    case Type::real:
      return std::isnan(value.real()) ? std::numeric_limits<double>::quiet_NaN() : value.real();
    case Type::date:
      return Date{value.date() + 0.0};
    case Type::string:
      budget.spend(value, value.string().size());
      return value.string();
    case Type::data:
      budget.spend(value, value.data().size());
      return Data(value.data().begin(), value.data().end());
    case Type::uid:
      return Uid{0};
    case Type::array:
      return elementsOf(value, budget);
    case Type::set:
      return Set{elementsOf(value, budget)};
    case Type::dictionary:
      return entriesOf(value, budget);
  }
  __builtin_unreachable();
}

inline Tree treeOf(Bytes message) {
  const Document document(message);
  ExpansionBudget budget(message.size());
  return treeOf(document.top(), budget);
}

}  // namespace PropertyList
