// SPDX-License-Identifier: Apache-2.0
/// A document as a tree, read as by somebody who pays for what is copied. Serves tests and tools.
///
/// Pure functions; may be used from any thread.
#pragma once

#include "plist/document.h"
#include "plist/tree.h"

namespace PropertyList {

/// Throws MalformedDocument, also when sharing makes the tree too large; std::out_of_range for a
/// UID above 64 bits; std::bad_alloc. It recurses at most Limits::nestedContainers deep.
Tree treeOf(Bytes message);

}  // namespace PropertyList
