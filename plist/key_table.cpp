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

/// The number of the key with this node's text. There is room for it.
std::uint32_t KeyTable::find(std::uint32_t node, std::uint64_t digest) {
  for (std::uint32_t step = 0; step < triedSlots; ++step) {
    Slot& tried = slot(digest, step);
    if (tried.number == 0) return append(node, digest, tried);
    if (tried.tag == tagOf(digest) && store_.keys[tried.number - 1].digest == digest &&
        (isWholeKey(digest) || store_.keyText(tried.number) == store_.text(store_.nodes[node]))) {
      return tried.number;
    }
  }
  return findColliding(node, digest);
}

/// Of a key for which no slot was vacant, now or when it came.
std::uint32_t KeyTable::findColliding(std::uint32_t node, std::uint64_t digest) {
  const auto found = colliding_.find(store_.text(store_.nodes[node]));
  if (found != colliding_.end()) return *found;
  const std::uint32_t number = append(node, digest);
  colliding_.insert(number);
  return number;
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
