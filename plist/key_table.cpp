// SPDX-License-Identifier: Apache-2.0
#include "plist/key_table.h"

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
  slots_.zero(std::size_t{1} << bits_);
}

std::size_t KeyTable::add(std::uint32_t dictionary, std::span<const Named> keys) {
  // In variables of its own: what the loop writes cannot change them.
  Node* const nodes = store_.nodes.data();
  Slot* const slots = slots_.data();
  const int bits = bits_;
  const std::uint32_t mark = dictionary + 1;
  const std::size_t before = store_.keys.size();
  store_.keys.resize(before + keys.size());
  Key* const known = store_.keys.data();
  std::uint32_t count = static_cast<std::uint32_t>(before);
  std::size_t added = 0;
  for (const Named& key : keys) {
    Node& node = nodes[key.node];
    std::uint32_t number = node.key();
    if (number == 0) {
      Slot& first = slots[keyHash(key.digest, bits)];
      // As a rule a key is new, and nothing is where it would be.
      if (first.number == 0) first = {count + 1, tagOf(key.digest)};
      number = first.number == count + 1 ? first.number : find(key, count);
      if (number > count)
        known[count++] = {.digest = key.digest, .node = key.node, .dictionary = 0};
      node.setKey(number);
    }
    if (known[number - 1].dictionary == mark) break;
    known[number - 1].dictionary = mark;
    ++added;
  }
  store_.keys.resize(count);
  return added;
}

/// The number of the key with this text: of those that are there, or the next.
std::uint32_t KeyTable::find(const Named& key, std::uint32_t count) {
  for (std::uint32_t step = 0; step < triedSlots; ++step) {
    Slot& tried = slot(key.digest, step);
    if (tried.number == 0) {
      tried = {count + 1, tagOf(key.digest)};
      return tried.number;
    }
    if (tried.tag == tagOf(key.digest) && store_.keys[tried.number - 1].digest == key.digest &&
        (isWholeKey(key.digest) ||
         store_.keyText(tried.number) == store_.text(store_.nodes[key.node]))) {
      return tried.number;
    }
  }
  // No slot was vacant, now or when it came.
  const auto found = colliding_.find(store_.text(store_.nodes[key.node]));
  if (found != colliding_.end()) return *found;
  // The set asks for its text.
  store_.keys[count].node = key.node;
  colliding_.insert(count + 1);
  return count + 1;
}

/// Makes room for so many keys. Those that are there find new slots.
void KeyTable::grow(std::size_t keys) {
  const std::size_t size = std::bit_ceil(2 * keys);
  slots_.zero(size);
  bits_ = std::countr_zero(size);
  colliding_.clear();
  for (std::uint32_t number = 1; number <= store_.keys.size(); ++number) place(number);
}

void KeyTable::place(std::uint32_t number) {
  const std::uint64_t digest = store_.keys[number - 1].digest;
  for (std::uint32_t step = 0; step < triedSlots; ++step) {
    Slot& tried = slot(digest, step);
    if (tried.number != 0) continue;
    tried = {number, tagOf(digest)};
    return;
  }
  colliding_.insert(number);
}

}  // namespace PropertyList
