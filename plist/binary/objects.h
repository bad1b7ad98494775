// SPDX-License-Identifier: Apache-2.0
/// The objects of a binary message: which is meant by a reference, and where it begins.
#pragma once

#include "plist/cursor.h"
#include "plist/store.h"

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace PropertyList {

/// What a binary message begins with.
inline constexpr std::string_view magic = "bplist00";

/// Where the objects stand, and their nodes. Borrowed. A loop takes a copy: what it writes to nodes
/// cannot change the copy, so that all of it stays in registers.
struct Objects {
  Bytes message;
  std::size_t offsetSize = 0;
  std::size_t referenceSize = 0;
  std::size_t tableStart = 0;
  Node* nodes = nullptr;
  std::size_t count = 0;

  /// The number of the object that is named at this position of the message.
  std::uint32_t reference(std::size_t position) const {
    const std::uint64_t number = Cursor::bigEndianAt(message, position, referenceSize);
    if (number >= count) throw MalformedDocument(Problem::referenceOutOfRange, position);
    return static_cast<std::uint32_t>(number);
  }
  /// Where the object of this number begins.
  std::size_t offset(std::uint32_t number) const {
    // Inside the table, since the number is below the count that the table was checked for.
    const std::size_t entry = tableStart + number * offsetSize;
    const std::uint64_t offset = Cursor::bigEndianAt(message, entry, offsetSize);
    if (offset < magic.size() || offset >= tableStart) {
      throw MalformedDocument(Problem::objectOutside, entry);
    }
    return static_cast<std::size_t>(offset);
  }
};

}  // namespace PropertyList
