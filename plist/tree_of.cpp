// SPDX-License-Identifier: Apache-2.0
#include "plist/tree_of.h"

#include "plist/expansion_budget.h"

#include <cmath>
#include <limits>
#include <stdexcept>

namespace PropertyList {
namespace {

Tree treeOf(const Value& value, ExpansionBudget& budget);

Array elementsOf(const Value& value, ExpansionBudget& budget) {
  Array elements;
  for (const Value element : value.elements()) elements.push_back(treeOf(element, budget));
  return elements;
}

Dictionary entriesOf(const Value& value, ExpansionBudget& budget) {
  Dictionary entries;
  for (const Entry entry : value.entries()) {
    budget.spend(value, entry.key.size() + 1);
    entries.emplace_back(std::string(entry.key), treeOf(entry.value, budget));
  }
  return entries;
}

Uid uidOf(Bytes bytes) {
  Uid uid{0};
  for (const std::byte byte : bytes) {
    if (uid.number >> 56 != 0) throw std::out_of_range("A UID does not fit 64 bits");
    uid.number = uid.number << 8 | std::to_integer<std::uint64_t>(byte);
  }
  return uid;
}

Tree treeOf(const Value& value, ExpansionBudget& budget) {
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
      return uidOf(value.uid());
    case Type::array:
      return elementsOf(value, budget);
    case Type::set:
      return Set{elementsOf(value, budget)};
    case Type::dictionary:
      return entriesOf(value, budget);
  }
  __builtin_unreachable();
}

}  // namespace

Tree treeOf(Bytes message) {
  const Document document(message);
  ExpansionBudget budget(message.size());
  return treeOf(document.top(), budget);
}

}  // namespace PropertyList
