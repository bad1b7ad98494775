// SPDX-License-Identifier: Apache-2.0
/// The values that messages and records are made of.
///
/// Every type here is a plain value: copying copies, nothing points into a message, and separate
/// objects may be used from separate threads. None of these operations throws anything but
/// std::bad_alloc.
#pragma once

#if __cplusplus < 202002L
#error "Keelgate's headers need C++20: compile with -std=c++20 or later"
#endif

#include <array>
#include <compare>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace Keelgate {

/// A borrowed octet string: the bytes of a message. Valid only as long as its owner. The bytes must
/// not change during a call.
using Bytes = std::span<const std::byte>;

/// The word-sized and the explicitly sized integers are both 64 bits wide, and are distinct types
/// on purpose: a schema says which of the two a field was declared with.
using Int = long;
using UInt = unsigned long;
using Int64 = long long;
using UInt64 = unsigned long long;
static_assert(sizeof(Int) == 8 && sizeof(UInt) == 8, "the word-sized integers have 64 bits");

/// IEEE 754, 64 bits. NaN and the infinities are values that a message can hold.
using Double = double;
using Bool = bool;

/// UTF-8, always valid. It may contain null characters and terminal control sequences.
using String = std::string;

/// An owned octet string. Its content is whatever the sender put there.
using Data = std::vector<std::byte>;

/// Absent means that the message had no such value, or null in its place; never that a value was
/// rejected.
template <class T>
using Optional = std::optional<T>;

/// In the order of the message, unless the field says otherwise.
template <class T>
using Array = std::vector<T>;

/// A point in time, in seconds since 2001-01-01T00:00:00Z, never NaN or infinite. Any finite
/// number, even far outside the calendar: check the range before converting it.
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
