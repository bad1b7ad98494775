// SPDX-License-Identifier: Apache-2.0
/// The record of any property list: the tree that the message is. Values that own all that they
/// hold; separate ones may be used from separate threads.
///
/// Containers nest at most 512 deep. A recursive walk needs enough stack for that; copying,
/// comparing and destroying a tree are such walks.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

#include <cstddef>

namespace Keelgate {

struct PropertyListValue;
struct PropertyListEntry;

/// An unordered collection, in the order of the message.
struct PropertyListSet {
  KEELGATE_RECORD(PropertyListSet,
      (Array<PropertyListValue>, elements));

  bool operator==(const PropertyListSet& other) const = default;
};

/// A 128-bit number that refers to something within the document.
struct PropertyListUID {
  KEELGATE_RECORD(PropertyListUID,
      (UInt64, high),
      (UInt64, low));

  bool operator==(const PropertyListUID&) const = default;
};

/// One value, with everything below it. The entries of a dictionary are in the order of the
/// message, and no key occurs twice. An integer is a UInt64 only above the largest Int64.
KEELGATE_CASES(PropertyListValue,
    (std::nullptr_t, null),
    (Bool, boolean),
    (Int64, integer),
    (UInt64, integer),
    (Double, real),
    (Date, date),
    (String, string),
    (Data, data),
    (PropertyListUID, uid),
    (Array<PropertyListValue>, array),
    (PropertyListSet, set),
    (Array<PropertyListEntry>, dictionary));

/// A key of a dictionary and its value.
struct PropertyListEntry {
  KEELGATE_RECORD(PropertyListEntry,
      (String, key),
      (PropertyListValue, value));

  bool operator==(const PropertyListEntry&) const = default;
};

/// A whole document. Its form has been checked, and nothing is known of its meaning.
struct PropertyList {
  KEELGATE_RECORD(PropertyList,
      (PropertyListValue, value));

  bool operator==(const PropertyList&) const = default;
};

}  // namespace Keelgate
