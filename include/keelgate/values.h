// SPDX-License-Identifier: Apache-2.0
/// The values that messages and records are made of.
///
/// Every type here is a plain value: copying copies, nothing points into a message, and separate
/// objects may be used from separate threads. None of these operations throws anything but
/// std::bad_alloc.
#pragma once

#include <array>
#include <compare>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace Keelgate {

/// A borrowed octet string: the bytes of a message. Valid only as long as its owner.
using Bytes = std::span<const std::byte>;

/// The word-sized and the explicitly sized integers are both 64 bits wide, and are distinct types
/// on purpose: a schema says which of the two a field was declared with.
using Int = long;
using UInt = unsigned long;
using Int64 = long long;
using UInt64 = unsigned long long;
static_assert(sizeof(Int) == 8 && sizeof(UInt) == 8, "the word-sized integers have 64 bits");

using Double = double;
using Bool = bool;

/// UTF-8, always valid.
using String = std::string;

/// An owned octet string.
using Data = std::vector<std::byte>;

template <class T>
using Optional = std::optional<T>;

template <class T>
using Array = std::vector<T>;

/// A point in time, in seconds since 2001-01-01T00:00:00Z, never NaN or infinite.
struct Date {
  double secondsSinceReferenceDate;

  auto operator<=>(const Date&) const = default;
};

/// A 128-bit identifier, most significant octet first.
struct UUID {
  std::array<std::uint8_t, 16> octets;

  auto operator<=>(const UUID&) const = default;
};

}  // namespace Keelgate
