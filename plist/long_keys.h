// SPDX-License-Identifier: Apache-2.0
// Finds a dictionary's repeated key in a binary document.
//
// The attack: keys are shared objects, so a million dictionaries can name the same two strings of
// a megabyte, equal but for their last byte, at a byte per reference. Comparing them in every
// dictionary would take days. So a dictionary whose keys are all short is checked at once, at a
// cost bounded per key; one with a long key waits until all strings are known, when the strings
// concerned are sorted and ranked once for the whole document and only ranks are compared.
//
// A resource of one reading; one thread.
#pragma once

#include <cstdint>
#include <string_view>

#include "plist/small_buffer.h"
#include "plist/store.h"

namespace PropertyList {

class LongKeys {
 public:
  explicit LongKeys(Store& store) noexcept : store_(store) {}

  // Checks the dictionary of this object number, or defers it. Its keys must all be read and be
  // strings. Throws Damage(Problem::duplicateKey), std::bad_alloc.
  void check(std::uint32_t dictionary);

  // Checks all that were deferred. Throws likewise.
  void checkDeferred();

 private:
  std::uint32_t keyAt(const Node& dictionary, std::uint32_t index) const noexcept;
  void collectStrings();
  void rankStrings();

  // Read alone: nodes and texts stay as they are.
  Store& store_;
  SmallBuffer<std::string_view, 64> keys_;
  SmallBuffer<std::uint32_t, 8> deferred_;  // dictionaries
  SmallBuffer<std::uint32_t, 8> strings_;   // their distinct keys' object numbers
  SmallBuffer<std::uint32_t, 8> ranks_;     // by object number; equal for equal strings
};

}  // namespace PropertyList
