// SPDX-License-Identifier: Apache-2.0
#include "plist/key_table.h"

#include "plist/key_hash.h"
#include "plist/malformed_document.h"

#include <bit>

namespace PropertyList {
namespace {

/// So few slots are tried for a key. At most half are taken, so of a million honest keys about ten
/// find none.
constexpr std::uint32_t triedSlots = 16;

/// Shorter first, so that strings of one length alone are compared byte by byte.
bool isBefore(std::string_view left, std::string_view right) noexcept {
  return left.size() != right.size() ? left.size() < right.size() : left < right;
}

}  // namespace

bool KeyTable::Less::operator()(std::uint32_t left, std::uint32_t right) const noexcept {
  return isBefore(store->keyText(left), store->keyText(right));
}

bool KeyTable::Less::operator()(std::uint32_t left, std::string_view right) const noexcept {
  return isBefore(store->keyText(left), right);
}

bool KeyTable::Less::operator()(std::string_view left, std::uint32_t right) const noexcept {
  return isBefore(left, store->keyText(right));
}

KeyTable::KeyTable(Store& store) : store_(store), colliding_(Less{&store}) {
  slots_.zero(64);
}

void KeyTable::check(std::uint32_t dictionary, std::size_t end) {
  // Once for all of them, and seldom for dictionaries whose keys are known.
  reserve(store_.keys.size() + store_.nodes[dictionary].count);
  std::size_t position = store_.firstChild(dictionary);
  for (std::uint32_t left = store_.nodes[dictionary].count; left > 0; --left) {
    const std::uint32_t node = store_.child(position);
    if (store_.nodes[node].key() == 0) store_.nodes[node].setKey(find(node));
    Key& key = store_.keys[store_.nodes[node].key() - 1];
    if (key.dictionary == dictionary + 1) {
      const std::size_t place = store_.place(position);
      throw MalformedDocument(Problem::duplicateKey, place != 0 ? place : end);
    }
    key.dictionary = dictionary + 1;
    position = store_.nextKey(position);
  }
}

/// The number of the key with this node's text, which is new as a rule. There is room for it.
std::uint32_t KeyTable::find(std::uint32_t node) {
  const std::string_view text = store_.text(store_.nodes[node]);
  const std::uint32_t hash = keyHash(text);
  const std::size_t mask = slots_.size() - 1;
  std::uint32_t* vacant = nullptr;
  for (std::uint32_t step = 0; step < triedSlots && vacant == nullptr; ++step) {
    std::uint32_t& slot = slots_[(hash + step * (step + 1) / 2) & mask];
    if (slot == 0) {
      vacant = &slot;
    } else if (store_.keys[slot - 1].hash == hash && store_.keyText(slot) == text) {
      return slot;
    }
  }
  if (!colliding_.empty()) {
    const auto found = colliding_.find(text);
    if (found != colliding_.end()) return *found;
  }
  store_.keys.push({.node = node, .hash = hash, .dictionary = 0});
  const auto number = static_cast<std::uint32_t>(store_.keys.size());
  if (vacant != nullptr) {
    *vacant = number;
  } else {
    colliding_.insert(number);
  }
  return number;
}

/// Makes room for so many keys. Those that are there find new slots.
void KeyTable::reserve(std::size_t keys) {
  if (2 * keys <= slots_.size()) return;
  slots_.zero(std::bit_ceil(4 * keys));
  colliding_.clear();
  for (std::uint32_t number = 1; number <= store_.keys.size(); ++number) place(number);
}

void KeyTable::place(std::uint32_t number) {
  const std::uint32_t hash = store_.keys[number - 1].hash;
  const std::size_t mask = slots_.size() - 1;
  for (std::uint32_t step = 0; step < triedSlots; ++step) {
    std::uint32_t& slot = slots_[(hash + step * (step + 1) / 2) & mask];
    if (slot != 0) continue;
    slot = number;
    return;
  }
  colliding_.insert(number);
}

}  // namespace PropertyList
