// SPDX-License-Identifier: Apache-2.0
// What a reader fills and a Document shows: one flat table of 16-byte nodes and one side buffer.
//
// Binary: nodes are indexed by object number, and children are the references in the message.
// XML: nodes stand in document order, a container before its children and a key before its value;
// a container knows where its last descendant ends.
//
// A resource of its Document; fixed once the reader has returned.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "plist/bytes.h"
#include "plist/cursor.h"
#include "plist/small_buffer.h"

namespace PropertyList {

// What values can be. The last two and null exist in binary alone: no field takes the two, and null
// is absence.
enum class Type : std::uint8_t {
  null,
  boolean,
  integer,
  real,
  date,
  string,
  data,
  array,
  dictionary,
  uid,
  set
};

constexpr bool isContainer(Type type) noexcept {
  return type == Type::array || type == Type::dictionary || type == Type::set;
}

// All zero is a node that has not been read yet.
struct Node {
  enum Flag : std::uint8_t {
    shared = 1,    // referenced more than once
    inSide = 2,    // the bytes are in the side buffer, not in the message
    negative = 4,  // an integer's bits are to be read as signed
    open = 8,      // binary: being walked, so that another reference to it closes a circle
    done = 16      // binary: checked with all that it reaches
  };

  // A scalar's value; where bytes or references begin; an XML container's end in the node table.
  std::uint64_t bits;
  std::uint32_t count;   // bytes, elements or entries
  std::uint16_t height;  // binary containers: the longest chain of containers from here
  Type type;
  std::uint8_t flags;

  bool has(Flag flag) const noexcept { return (flags & flag) != 0; }
  void set(Flag flag) noexcept { flags = static_cast<std::uint8_t>(flags | flag); }
};
// A byte of offset table can ask for a node, so this is the factor between a hostile message and
// its table.
static_assert(sizeof(Node) == 16);

// Inline room for a small message: 128 nodes are 2 KiB, on the stack of whoever decodes. Two
// formats, one shape: whoever walks it asks the members below and never knows which it is.
struct Store {
  Bytes message;
  SmallBuffer<Node, 128> nodes;
  SmallBuffer<char, 512> side;    // unescaped and converted text, decoded base64
  std::size_t referenceSize = 0;  // bytes; 0 for XML
  std::uint32_t top = 0;

  // A string's or data's bytes. The view is good until the side buffer grows: readers keep offsets,
  // and views only once they are through.
  std::string_view text(const Node& node) const noexcept {
    const auto offset = static_cast<std::size_t>(node.bits);
    if (node.has(Node::inSide)) return {side.data() + offset, node.count};
    return Cursor::textAt(message, offset, node.count);
  }

  // A position among children is an offset into the message in binary, a node number in XML.
  // Where a container's children begin.
  std::size_t firstChild(std::uint32_t container) const noexcept {
    return referenceSize == 0 ? container + std::size_t{1}
                              : static_cast<std::size_t>(nodes[container].bits);
  }
  // The reader has held every reference against the number of objects.
  std::uint32_t child(std::size_t position) const noexcept {
    const std::uint64_t number =
        referenceSize == 0 ? position : Cursor::bigEndianAt(message, position, referenceSize);
    return static_cast<std::uint32_t>(number);
  }
  // The next sibling. In XML that is past all descendants.
  std::size_t after(std::size_t position) const noexcept {
    if (referenceSize != 0) return position + referenceSize;
    const Node& node = nodes[position];
    return isContainer(node.type) ? static_cast<std::size_t>(node.bits) : position + 1;
  }
};

// Fill a store whose message is set. Throw Damage and std::bad_alloc. They leave the store as it is
// then: a Document whose constructor throws is never seen.
void readBinary(Store& store);
void readXml(Store& store);

}  // namespace PropertyList
