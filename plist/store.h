// SPDX-License-Identifier: Apache-2.0
/// What a reader fills and a Document shows: one table of 16-byte nodes, the distinct keys, and one
/// side buffer.
///
/// Binary: a node for each object of the message, under its number; children are the references in
/// the message. XML: nodes in the order of the message, a container before its children and a key
/// before its value; a container knows where its last descendant ends.
///
/// A resource of its Document; fixed once the reader has returned.
#pragma once

#include "plist/bytes.h"
#include "plist/cursor.h"
#include "plist/known_keys.h"
#include "plist/small_buffer.h"

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace PropertyList {

/// What values can be. The last two and null exist in binary alone: no field takes the two, and
/// null is absence.
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

struct Node {
  enum Flag : std::uint8_t {
    shared = 1,    // referenced more than once
    inSide = 2,    // the bytes are in the side buffer, not in the message
    negative = 4,  // an integer's bits are to be read as signed
    open = 8,      // binary: being walked, so that another reference to it closes a circle
    read = 16      // binary: reached; others are zero
  };

  /// A scalar's value. The position of bytes or references, and above it a key's number. An XML
  /// container's end in the node table.
  std::uint64_t bits;
  std::uint32_t count = 0;   // bytes, elements or entries; 0 where a number is in `bits`
  std::uint16_t height = 0;  // binary containers: the longest chain of containers from here
  Type type;
  std::uint8_t flags = 0;

  bool has(Flag flag) const noexcept { return (flags & flag) != 0; }
  void set(Flag flag) noexcept { flags = static_cast<std::uint8_t>(flags | flag); }

  std::uint32_t position() const noexcept { return static_cast<std::uint32_t>(bits); }
  /// Of a dictionary's key: its number in the key table, counted from 1. 0 before it has one.
  std::uint32_t key() const noexcept { return static_cast<std::uint32_t>(bits >> 32); }
  void setKey(std::uint32_t number) noexcept { bits |= std::uint64_t{number} << 32; }
};
static_assert(sizeof(Node) == 16);

/// A distinct key of the document that is not known beforehand.
struct Key {
  std::uint64_t digest;  // keyDigest of the text
  std::uint32_t node;    // the first with this text
};

/// Inline room for a small message, on the stack of whoever decodes. Two formats, one shape:
/// whoever walks it asks the members below and never knows which it is.
struct Store {
  Bytes message;
  SmallBuffer<Node, 512> nodes;
  std::uint32_t top = 0;        // the node of the top object
  SmallBuffer<char, 512> side;  // unescaped and converted text, decoded base64
  /// Numbers of keys are counted from 1: first those that are known, whether the document has them
  /// or not, then the others.
  const KnownKeys* known = &noKnownKeys;
  SmallBuffer<Key, 256> keys;
  std::size_t referenceSize = 0;  // bytes; 0 for XML

  /// A string's or data's bytes. The view is good until the side buffer grows: readers keep
  /// positions, and views only once they are through.
  std::string_view text(const Node& node) const noexcept {
    if (node.has(Node::inSide)) return {side.data() + node.position(), node.count};
    return Cursor::textAt(message, node.position(), node.count);
  }

  /// Of a number that the reader has left in the message.
  std::uint64_t number(const Node& node) const noexcept {
    return Cursor::bigEndianAt(message, node.position(), node.count);
  }

  /// Of a key by its number.
  std::uint64_t digest(std::uint32_t number) const noexcept {
    return number > known->count ? otherKey(number).digest : known->digests[number - 1];
  }
  /// Of one that is not known.
  const Key& otherKey(std::uint32_t number) const noexcept {
    return keys[number - known->count - 1];
  }

  /// A position among children is an offset into the message in binary, a node number in XML.
  /// Where a container's children begin.
  std::size_t firstChild(std::uint32_t container) const noexcept {
    return referenceSize == 0 ? container + std::size_t{1} : nodes[container].position();
  }
  /// The node of a child. The reader has held every reference against the number of objects.
  std::uint32_t child(std::size_t position) const noexcept {
    if (referenceSize == 0) return static_cast<std::uint32_t>(position);
    return static_cast<std::uint32_t>(Cursor::bigEndianAt(message, position, referenceSize));
  }
  /// The next sibling. In XML that is past all descendants.
  std::size_t after(std::size_t position) const noexcept {
    if (referenceSize != 0) return position + referenceSize;
    const Node& node = nodes[position];
    return isContainer(node.type) ? static_cast<std::size_t>(node.bits) : position + 1;
  }
  /// The key after this one. Binary keeps all keys before all values; XML has them in turn.
  std::size_t nextKey(std::size_t key) const noexcept {
    return referenceSize != 0 ? key + referenceSize : after(key + 1);
  }
};

/// Fill a store whose message is set. Throw MalformedDocument and
/// std::bad_alloc, and leave the store as it is then: a Document whose constructor throws is never
/// seen.
void readBinary(Store& store);
void readXml(Store& store);

}  // namespace PropertyList
