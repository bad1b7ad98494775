// SPDX-License-Identifier: Apache-2.0
// What both property-list harnesses ask of a message: it is refused as malformed, or everything in
// it can be walked, and its value, rewritten in either format, reads back as the same value.
#pragma once

#include <cstdlib>
#include <stdexcept>

#include "plist/malformed_document.h"
#include "plist/tree_of.h"
#include "plist/writer.h"

namespace PropertyList {

inline void require(bool holds) {
  if (!holds) std::abort();
}

inline void checkTwins(Bytes message) {
  Tree tree = nullptr;
  try {
    tree = treeOf(message);
  } catch (const MalformedDocument& error) {
    require(error.offset() <= message.size());
    return;
  } catch (const std::out_of_range&) {
    return;  // a UID that a tree cannot hold
  }
  // Compared as bytes, in which a NaN equals itself.
  const std::vector<std::byte> binary = writeBinary(tree);
  // What sharing blew up has been walked, and that is enough: its twins would only take time.
  if (binary.size() > std::size_t{16} * 1024) return;
  require(writeBinary(treeOf(binary)) == binary);
  std::string xml;
  try {
    xml = writeXml(tree);
  } catch (const std::invalid_argument&) {
    return;  // a null, a UID, a control character: binary has more than XML
  }
  require(writeBinary(treeOf(std::as_bytes(std::span(xml)))) == binary);
}

}  // namespace PropertyList
