// SPDX-License-Identifier: Apache-2.0
/// The amplification guard.
///
/// The attack: a binary property list may reference one object from many places. An array of two
/// references to an array of two references to ..., 64 levels deep, takes 300 bytes and has 2^64
/// leaves. Checking it is cheap, because every object is checked once; whoever copies what it
/// means would never end. The same works at one level with one long string and a million one-byte
/// references to it. So whoever turns values into something that takes memory spends from a budget
/// before each step, and only shared values cost anything: what is referenced once is paid for by
/// its own bytes in the message.
///
/// A resource of one decoding; one thread at a time.
#pragma once

#include "plist/document.h"
#include "plist/limits.h"

#include <cstddef>
#include <cstdint>

namespace PropertyList {

class ExpansionBudget {
 public:
  /// The allowance follows from the length of the message, in bytes.
  explicit ExpansionBudget(std::size_t messageLength) noexcept
      : left_(Limits::expansionBase + Limits::expansionFactor * std::uint64_t{messageLength}) {}

  /// To be called before `bytes` of memory, at least 1, are made from the value. Free unless the
  /// value is shared. Throws MalformedDocument(excessiveExpansion) when the allowance is used up.
  void spend(const Value& value, std::size_t bytes) {
    if (value.isShared()) take(value, bytes);
  }

  /// The same, whether the value is shared or not: for what is copied from parts of it that may be.
  void take(const Value& value, std::size_t bytes) {
    // Compared before it is subtracted: an amount near 2^64 must not wrap.
    if (bytes > left_) throw MalformedDocument(Problem::excessiveExpansion, value.position());
    left_ -= bytes;
  }

 private:
  std::uint64_t left_;
};

}  // namespace PropertyList
