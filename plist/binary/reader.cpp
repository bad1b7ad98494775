// SPDX-License-Identifier: Apache-2.0
/// Reads binary property lists: every object that the top one reaches, each once, depth first over
/// an explicit stack.
///
/// Every number in a message is hostile. A count is compared with what remains of the object area
/// before it is multiplied or reserved for, so that no claim can overflow or make memory be set
/// aside.
#include "plist/binary/objects.h"
#include "plist/binary/utf16.h"
#include "plist/key_table.h"
#include "plist/limits.h"
#include "plist/store.h"
#include "text/utf8.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>

namespace PropertyList {
namespace {

constexpr std::size_t trailerLength = 32;
constexpr std::size_t trailerUnused = 6;

class BinaryReader {
 public:
  explicit BinaryReader(Store& store) : store_(store), keys_(store) {}

  void read();

 private:
  /// A container being walked: its references to values from `next` to `end`.
  struct Frame {
    std::uint32_t node;
    std::uint16_t highest;  // of the children walked so far
    std::size_t next;
    std::size_t end;
  };

  std::uint32_t readTrailer();
  template <class Widths>
  [[gnu::noinline]] void walkAll();
  template <class Widths>
  void walk(Frame& frame);
  template <class Widths>
  void readKeys(Frame& frame);
  void leave(const Frame& frame);
  void readOtherKey(std::uint32_t number, std::size_t position);
  [[gnu::always_inline]] inline bool load(const Objects& objects, std::uint32_t number);
  template <class Widths>
  void open(std::uint32_t number);
  void revisit(Node& node, std::size_t position) {
    node.set(Node::shared);
    if (isContainer(node.type)) revisitContainer(node, position);
  }
  void revisitContainer(const Node& node, std::size_t position);
  Node readObject(std::size_t offset);
  Node readInteger(Cursor& object, unsigned width);
  Node readDouble(Cursor& object, Type type, unsigned width);
  Node readBytes(Cursor& object, Type type, std::uint64_t length);
  Node readUtf16(Cursor& object, std::uint64_t units);
  Node readContainer(Cursor& object, Type type, std::uint64_t count);
  std::uint64_t readCount(Cursor& object, unsigned low);
  Bytes claim(Cursor& object, std::uint64_t length);

  Store& store_;
  KeyTable keys_;
  Objects objects_;
  /// What is left of the bytes that objects may claim.
  std::uint64_t claimable_ = 0;
  std::size_t depth_ = 0;
  /// Whatever the message nests: no recursion that a message could drive.
  std::array<Frame, Limits::nestedContainers> frames_;
};

/// Of offsets and references. The commonest are compiled in, which takes a sixth off the check of a
/// message: a shift by a number that a register has to hold is slower, and each object takes two.
struct AnyWidths {
  static Objects of(const Objects& objects) { return objects; }
};
template <std::size_t offsetSize, std::size_t referenceSize>
struct FixedWidths {
  static Objects of(Objects objects) {
    objects.offsetSize = offsetSize;
    objects.referenceSize = referenceSize;
    return objects;
  }
};

void BinaryReader::read() {
  store_.top = readTrailer();
  if (objects_.offsetSize == 1 && objects_.referenceSize == 1) return walkAll<FixedWidths<1, 1>>();
  if (objects_.offsetSize == 2 && objects_.referenceSize == 1) return walkAll<FixedWidths<2, 1>>();
  if (objects_.offsetSize == 2 && objects_.referenceSize == 2) return walkAll<FixedWidths<2, 2>>();
  walkAll<AnyWidths>();
}

template <class Widths>
void BinaryReader::walkAll() {
  if (load(objects_, store_.top)) open<Widths>(store_.top);
  while (depth_ > 0) walk<Widths>(frames_[depth_ - 1]);
}

/// Returns the number of the top object.
///
/// Deliberate: the unused bytes are not looked at, nor is what may lie between the offset table and
/// the trailer: nothing reaches it.
std::uint32_t BinaryReader::readTrailer() {
  const Bytes message = store_.message;
  if (!Cursor(message).skipIf(magic)) throw MalformedDocument(Problem::otherVersion, 0);
  if (message.size() < magic.size() + trailerLength) {
    throw MalformedDocument(Problem::truncated, message.size());
  }
  const std::size_t tableEnd = message.size() - trailerLength;
  Cursor trailer(message, tableEnd + trailerUnused, message.size());
  const std::size_t offsetSize = trailer.byte();
  const std::size_t referenceSize = trailer.byte();
  const std::uint64_t objects = trailer.bigEndian(8);
  const std::uint64_t top = trailer.bigEndian(8);
  const std::uint64_t table = trailer.bigEndian(8);
  const bool sizesFit =
      offsetSize >= 1 && offsetSize <= 8 && referenceSize >= 1 && referenceSize <= 8;
  // Divided, because a product of two of these could wrap. What passes has no more objects than the
  // message has bytes, so their numbers fit 32 bits.
  if (!sizesFit || top >= objects || table < magic.size() || table > tableEnd ||
      objects > (tableEnd - table) / offsetSize) {
    throw MalformedDocument(Problem::trailer, tableEnd);
  }
  store_.referenceSize = referenceSize;
  store_.nodes.zero(static_cast<std::size_t>(objects));
  objects_ = {.message = message,
              .offsetSize = offsetSize,
              .referenceSize = referenceSize,
              .tableStart = static_cast<std::size_t>(table),
              .nodes = store_.nodes.data(),
              .count = store_.nodes.size()};
  claimable_ = Limits::claimedBase + Limits::claimedFactor * message.size();
  return static_cast<std::uint32_t>(top);
}

/// Walks the references of the innermost container, as far as one that opens another container.
template <class Widths>
void BinaryReader::walk(Frame& frame) {
  const Objects objects = Widths::of(objects_);
  const std::size_t end = frame.end;
  for (std::size_t next = frame.next; next < end; next += objects.referenceSize) {
    const std::uint32_t number = objects.reference(next);
    Node& node = objects.nodes[number];
    if (node.has(Node::read)) {
      revisit(node, next);
      continue;
    }
    if (!load(objects, number)) continue;
    frame.next = next + objects.referenceSize;
    return open<Widths>(number);
  }
  leave(frame);
}

/// All keys of a dictionary, which stand before its values. Of several faults the first is told.
template <class Widths>
void BinaryReader::readKeys(Frame& frame) try {
  const Objects objects = Widths::of(objects_);
  const std::size_t end = frame.end;
  keys_.begin(frame.node, objects.nodes[frame.node].count);
  for (std::size_t next = frame.next; next < end; next += objects.referenceSize) {
    const std::uint32_t number = objects.reference(next);
    Node& node = objects.nodes[number];
    const std::uint64_t digest =
        node.has(Node::read) ? 0 : objects.readKey(objects.offset(number), claimable_, node);
    if (digest != 0) {
      keys_.add(number, digest, next);
    } else {
      readOtherKey(number, next);
    }
  }
  keys_.end();
  frame.next = end;
} catch (const MalformedDocument&) {
  // A key that waits for its look-up may be a fault that stands before this one.
  keys_.end();
  throw;
}

/// Any other. Apart, so that the first kind has the registers.
[[gnu::noinline]] void BinaryReader::readOtherKey(std::uint32_t number, std::size_t position) {
  Node& node = objects_.nodes[number];
  if (node.has(Node::read)) {
    revisit(node, position);
  } else {
    load(objects_, number);
  }
  if (node.type != Type::string) throw MalformedDocument(Problem::keyNotString, position);
  keys_.add(number, position);
}

/// Another reference to what was read before. Heights make the limit exact although every object is
/// walked once: a chain of containers that is joined lower down counts by what it was found to be.
void BinaryReader::revisitContainer(const Node& node, std::size_t position) {
  // Open is every container on the stack, and none beside.
  if (node.has(Node::open)) throw MalformedDocument(Problem::selfContaining, position);
  if (depth_ + node.height > Limits::nestedContainers) {
    throw MalformedDocument(Problem::tooDeep, position);
  }
  Frame& frame = frames_[depth_ - 1];
  frame.highest = std::max(frame.highest, node.height);
}

/// All children are checked: the container is, too.
void BinaryReader::leave(const Frame& frame) {
  Node& node = store_.nodes[frame.node];
  node.height = static_cast<std::uint16_t>(frame.highest + 1);
  node.flags = static_cast<std::uint8_t>(node.flags & ~Node::open);
  --depth_;
  if (depth_ > 0) frames_[depth_ - 1].highest = std::max(frames_[depth_ - 1].highest, node.height);
}

/// Reads the object of this number, for the first time. Says whether it is to be opened.
bool BinaryReader::load(const Objects& objects, std::uint32_t number) {
  const std::size_t offset = objects.offset(number);
  Node& node = objects.nodes[number];
  if (objects.readShort(offset, claimable_, node)) return false;
  node = readObject(offset);
  node.set(Node::read);
  return node.has(Node::open);
}

/// Makes a container that was read the innermost frame.
template <class Widths>
void BinaryReader::open(std::uint32_t number) {
  const Node& node = objects_.nodes[number];
  const std::size_t length = node.count * objects_.referenceSize;
  Frame& frame = frames_[depth_++];
  frame = {.node = number, .highest = 0, .next = node.position(), .end = node.position() + length};
  if (node.type != Type::dictionary) return;
  readKeys<Widths>(frame);
  frame.end += length;
}

/// Apart, so that what short objects take stays small enough to be inlined.
[[gnu::noinline]] Node BinaryReader::readObject(std::size_t offset) {
  Cursor object(store_.message, offset, objects_.tableStart);
  const unsigned marker = object.byte();
  const unsigned low = marker & 0xf;
  switch (marker >> 4) {
    case 0x0:
      if (marker == 0x00) return {.bits = 0, .type = Type::null};
      if (low != 8 && low != 9) break;
      return {.bits = low - 8, .type = Type::boolean};
    case 0x1:
      if (low <= 4) return readInteger(object, low);
      break;
    case 0x2:
      if (low == 2 || low == 3) return readDouble(object, Type::real, low);
      break;
    case 0x3:
      if (low == 3) return readDouble(object, Type::date, low);
      break;
    case 0x4:
      return readBytes(object, Type::data, readCount(object, low));
    case 0x5:
      return readBytes(object, Type::string, readCount(object, low));
    case 0x6:
      return readUtf16(object, readCount(object, low));
    case 0x8:
      return readBytes(object, Type::uid, low + 1);
    case 0xA:
      return readContainer(object, Type::array, readCount(object, low));
    case 0xC:
      return readContainer(object, Type::set, readCount(object, low));
    case 0xD:
      return readContainer(object, Type::dictionary, readCount(object, low));
    default:
      break;
  }
  throw MalformedDocument(Problem::unknownMarker, offset);
}

/// 1, 2, 4, 8 or 16 bytes. The narrow ones have no sign, 8 and 16 bytes do.
Node BinaryReader::readInteger(Cursor& object, unsigned width) {
  const std::size_t start = object.position();
  std::uint64_t high = 0;
  if (width == 4) high = object.bigEndian(8);
  const std::uint64_t low = object.bigEndian(width == 4 ? 8 : std::size_t{1} << width);
  const bool isNegative = width == 3 ? low >> 63 != 0 : high != 0;
  // Of 16 bytes the upper half may only extend the sign of the lower, or be zero.
  if (width == 4 && isNegative && (high != ~std::uint64_t{0} || low >> 63 == 0)) {
    throw MalformedDocument(Problem::integerTooLarge, start - 1);
  }
  Node node{.bits = low, .type = Type::integer};
  if (isNegative) node.set(Node::negative);
  return node;
}

Node BinaryReader::readDouble(Cursor& object, Type type, unsigned width) {
  const std::size_t start = object.position();
  const std::uint64_t bits = object.bigEndian(std::size_t{1} << width);
  const double number = width == 2 ? std::bit_cast<float>(static_cast<std::uint32_t>(bits))
                                   : std::bit_cast<double>(bits);
  if (type == Type::date && !std::isfinite(number)) {
    throw MalformedDocument(Problem::dateNotFinite, start - 1);
  }
  return {.bits = std::bit_cast<std::uint64_t>(number), .type = type};
}

Node BinaryReader::readBytes(Cursor& object, Type type, std::uint64_t length) {
  const std::size_t start = object.position();
  claim(object, length);
  if (type == Type::string && !Text::isAscii(object.since(start))) {
    throw MalformedDocument(Problem::notAscii, start);
  }
  return {.bits = start, .count = static_cast<std::uint32_t>(length), .type = type};
}

/// Converted once here, so that every string is one view ever after.
Node BinaryReader::readUtf16(Cursor& object, std::uint64_t units) {
  const std::size_t start = object.position();
  // Before it is multiplied.
  if (units > object.remaining()) throw MalformedDocument(Problem::objectOutside, start);
  const Bytes bytes = claim(object, 2 * units);
  // The most that UTF-8 can need, then cut to what it did need.
  const std::size_t side = store_.side.size();
  store_.side.resize(side + 3 * static_cast<std::size_t>(units));
  const auto length = utf8FromUtf16(bytes, store_.side.data() + side);
  // Half a pair has no UTF-8, and whatever stood in for it could make two keys equal.
  if (!length) throw MalformedDocument(Problem::straySurrogate, start);
  store_.side.resize(side + *length);
  if (store_.side.size() > Limits::length) throw MalformedDocument(Problem::messageTooLarge, start);
  return {.bits = side,
          .count = static_cast<std::uint32_t>(*length),
          .type = Type::string,
          .flags = Node::inSide};
}

/// Children are walked later, from the frame; here only their references are known to be there.
Node BinaryReader::readContainer(Cursor& object, Type type, std::uint64_t count) {
  const std::size_t start = object.position();
  // Before it is multiplied.
  if (count > object.remaining()) throw MalformedDocument(Problem::objectOutside, start);
  if (depth_ == Limits::nestedContainers) throw MalformedDocument(Problem::tooDeep, start);
  const std::uint64_t length = count * store_.referenceSize;
  claim(object, type == Type::dictionary ? 2 * length : length);
  // Open until it is left: a reference to it from below closes a circle.
  return {
      .bits = start, .count = static_cast<std::uint32_t>(count), .type = type, .flags = Node::open};
}

/// Deliberate: a count is read as unsigned at all widths. A negative one is then vast, and fails
/// where it is compared with what remains.
std::uint64_t BinaryReader::readCount(Cursor& object, unsigned low) {
  if (low != 0xf) return low;
  const std::size_t position = object.position();
  const unsigned marker = object.byte();
  // 1 to 8 bytes: no count needs 16.
  if (marker < 0x10 || marker > 0x13) throw MalformedDocument(Problem::badCount, position);
  return object.bigEndian(std::size_t{1} << (marker & 0xf));
}

/// Every variable-length object takes its bytes here, so that objects which overlap are charged.
Bytes BinaryReader::claim(Cursor& object, std::uint64_t length) {
  const std::size_t position = object.position();
  const Bytes bytes = object.take(length);
  if (length > claimable_) throw MalformedDocument(Problem::overlappingObjects, position);
  claimable_ -= length;
  return bytes;
}

}  // namespace

void readBinary(Store& store) {
  BinaryReader(store).read();
}

}  // namespace PropertyList
