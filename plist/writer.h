// SPDX-License-Identifier: Apache-2.0
/// Writes trees as property lists, the same tree always as the same bytes.
///
/// Pure functions; may be used from any thread. Both throw std::invalid_argument for a tree that
/// the format cannot express. Repeated keys and too deep a nesting are written as they are,
/// although no reader takes them: messages to be refused are made here too.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "plist/bytes.h"
#include "plist/tree.h"

namespace PropertyList {

/// Binary, with the narrowest widths that fit. Equal scalars are written once. Refuses strings that
/// are not valid UTF-8 and dates that are not finite.
std::vector<std::byte> writeBinary(const Tree& tree);

/// XML, indented by tabs, without document type. Refuses also what XML property lists do not have:
/// null, UIDs, sets, characters that XML forbids, and dates that are not a whole second of the
/// years 1 to 9999.
std::string writeXml(const Tree& tree);

}  // namespace PropertyList
