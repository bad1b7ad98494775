// SPDX-License-Identifier: Apache-2.0
#include "plist/expansion_budget.h"

#include "plist/limits.h"

namespace PropertyList {

ExpansionBudget::ExpansionBudget(std::size_t messageLength) noexcept
    : left_(Limits::expansionBase + Limits::expansionFactor * std::uint64_t{messageLength}) {}

// Compared before it is subtracted: an amount near 2^64 must not wrap.
void ExpansionBudget::take(std::size_t bytes) {
  if (bytes > left_) throw Damage(Problem::excessiveExpansion, 0);
  left_ -= bytes;
}

}  // namespace PropertyList
