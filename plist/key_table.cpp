// SPDX-License-Identifier: Apache-2.0
#include "plist/key_table.h"

#include <bit>
#include <span>
#include <utility>

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
  return isBefore(table->text(left), table->text(right));
}

bool KeyTable::Less::operator()(std::uint32_t left, std::string_view right) const noexcept {
  return isBefore(table->text(left), right);
}

bool KeyTable::Less::operator()(std::string_view left, std::uint32_t right) const noexcept {
  return isBefore(left, table->text(right));
}

KeyTable::KeyTable(Store& store) : store_(store), known_(*store.known), colliding_(Less{this}) {
  last_.zero(known_.count);
}

void KeyTable::addWaiting() {
  for (const Other& key : std::span(waiting_).first(std::exchange(waitingCount_, 0))) {
    note(number(key), key.position);
  }
}

/// Unless another key that came before it is to be refused.
void KeyTable::refuse(std::size_t position) {
  addWaiting();
  throw MalformedDocument(Problem::duplicateKey, position);
}

/// Of a key that had none when it came.
std::uint32_t KeyTable::number(const Other& key) {
  Node& node = store_.nodes[key.node];
  // A dictionary may name one string twice.
  if (node.key() != 0) return node.key();
  if (2 * most_ > slots_.size()) grow(most_);
  const std::uint32_t next = known_.count + static_cast<std::uint32_t>(store_.keys.size()) + 1;
  // As a rule a key is new, and nothing is where it would be.
  store_.keys.push({.digest = key.digest, .node = key.node});
  Slot& first = slots_[keyHash(key.digest, bits_)];
  if (first.number == 0) first = {next, tagOf(key.digest)};
  const std::uint32_t its = first.number == next ? next : find(key, next);
  if (its == next) {
    last_.push(0);
  } else {
    store_.keys.resize(store_.keys.size() - 1);
  }
  node.setKey(its);
  return its;
}

/// The number of the key with this text: of those that are there, or the next, which is the key's
/// own.
std::uint32_t KeyTable::find(const Other& key, std::uint32_t next) {
  const std::string_view itsText = store_.text(store_.nodes[key.node]);
  for (std::uint32_t step = 0; step < triedSlots; ++step) {
    Slot& tried = slot(key.digest, step);
    if (tried.number == 0) {
      tried = {next, tagOf(key.digest)};
      return next;
    }
    if (tried.tag == tagOf(key.digest) && store_.otherKey(tried.number).digest == key.digest &&
        (isWholeKey(key.digest) || text(tried.number) == itsText)) {
      return tried.number;
    }
  }
  // No slot was vacant, now or when it came.
  const auto found = colliding_.find(itsText);
  return found != colliding_.end() ? *found : *colliding_.insert(next).first;
}

/// Makes room for so many keys. Those that are there find new slots.
void KeyTable::grow(std::size_t keys) {
  const std::size_t size = std::bit_ceil(2 * keys);
  slots_.zero(size);
  bits_ = std::countr_zero(size);
  colliding_.clear();
  for (std::uint32_t i = 1; i <= store_.keys.size(); ++i) place(known_.count + i);
}

void KeyTable::place(std::uint32_t number) {
  const std::uint64_t digest = store_.digest(number);
  for (std::uint32_t step = 0; step < triedSlots; ++step) {
    Slot& tried = slot(digest, step);
    if (tried.number != 0) continue;
    tried = {number, tagOf(digest)};
    return;
  }
  colliding_.insert(number);
}

}  // namespace PropertyList
