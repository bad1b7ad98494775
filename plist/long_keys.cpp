// SPDX-License-Identifier: Apache-2.0
// Ranks: equal strings get equal numbers, so that numbers can be compared in their place.
#include "plist/long_keys.h"

#include <algorithm>

#include "plist/damage.h"
#include "plist/duplicates.h"
#include "plist/limits.h"

namespace PropertyList {

constexpr std::uint32_t unranked = 0;
constexpr std::uint32_t collected = 0xFFFF'FFFF;

std::uint32_t LongKeys::keyAt(const Node& dictionary, std::uint32_t index) const noexcept {
  return store_.child(static_cast<std::size_t>(dictionary.bits) + index * store_.referenceSize);
}

// Bounded per key: the fingerprint looks at 24 bytes, a comparison at no more than a short key has.
void LongKeys::check(std::uint32_t number) {
  const Node& dictionary = store_.nodes[number];
  keys_.clear();
  for (std::uint32_t i = 0; i < dictionary.count; ++i) {
    const std::string_view key = store_.text(store_.nodes[keyAt(dictionary, i)]);
    if (key.size() > Limits::shortKey) return deferred_.push(number);
    keys_.push(key);
  }
  if (hasDuplicates(keys_.all())) {
    throw Damage(Problem::duplicateKey, static_cast<std::size_t>(dictionary.bits));
  }
}

void LongKeys::checkDeferred() {
  if (deferred_.size() == 0) return;
  collectStrings();
  rankStrings();
  // By rank, the last dictionary that had the key, counted from 1.
  SmallBuffer<std::uint32_t, 8> seen;
  seen.zero(strings_.size() + 1);
  for (std::size_t i = 0; i < deferred_.size(); ++i) {
    const auto dictionaryIndex = static_cast<std::uint32_t>(i + 1);
    const Node& dictionary = store_.nodes[deferred_[i]];
    for (std::uint32_t k = 0; k < dictionary.count; ++k) {
      std::uint32_t& last = seen[ranks_[keyAt(dictionary, k)]];
      if (last == dictionaryIndex) {
        throw Damage(Problem::duplicateKey, static_cast<std::size_t>(dictionary.bits));
      }
      last = dictionaryIndex;
    }
  }
}

// Each string once, however many dictionaries name it.
void LongKeys::collectStrings() {
  ranks_.zero(store_.nodes.size());
  for (const std::uint32_t number : deferred_.all()) {
    const Node& dictionary = store_.nodes[number];
    for (std::uint32_t k = 0; k < dictionary.count; ++k) {
      const std::uint32_t key = keyAt(dictionary, k);
      if (ranks_[key] != unranked) continue;
      ranks_[key] = collected;
      strings_.push(key);
    }
  }
}

void LongKeys::rankStrings() {
  const auto text = [this](std::uint32_t number) {
    return store_.text(store_.nodes[number]);
  };
  const auto strings = strings_.all();
  // Strings of one length alone are compared by bytes; together they are no longer than what
  // objects may claim, so the sort costs that times a logarithm.
  std::sort(strings.begin(), strings.end(), [&](std::uint32_t left, std::uint32_t right) {
    return isBefore(text(left), text(right));
  });
  std::uint32_t rank = unranked;
  for (std::size_t i = 0; i < strings.size(); ++i) {
    if (i == 0 || text(strings[i]) != text(strings[i - 1])) ++rank;
    ranks_[strings[i]] = rank;
  }
}

}  // namespace PropertyList
