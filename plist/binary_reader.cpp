// SPDX-License-Identifier: Apache-2.0
// Reads binary property lists: every object that the top one reaches, each once, depth first over
// an explicit stack.
//
// Every number in a message is hostile. A count is compared with what remains of the object area
// before it is multiplied or reserved for, so that no claim can overflow or make memory be set
// aside.
#include <algorithm>
#include <array>
#include <bit>
#include <cmath>

#include "plist/damage.h"
#include "plist/limits.h"
#include "plist/long_keys.h"
#include "plist/store.h"
#include "plist/unicode.h"
#include "text/utf8.h"

namespace PropertyList {
namespace {

constexpr std::string_view magic = "bplist00";
constexpr std::size_t trailerLength = 32;
constexpr std::size_t trailerUnused = 6;

class BinaryReader {
 public:
  explicit BinaryReader(Store& store) noexcept : store_(store), keys_(store) {}

  void read();

 private:
  // A container being walked: its references from `next` to `end`, the first ones keys.
  struct Frame {
    std::uint32_t number;
    std::uint16_t highest;  // of the children walked so far
    std::size_t next;
    std::size_t keysEnd;
    std::size_t end;
  };

  void readTrailer();
  void follow(Frame& frame);
  void leave(const Frame& frame);
  void enter(std::uint32_t number);
  void readObject(Node& node, std::uint32_t number, Cursor& object, std::uint8_t marker);
  void readSingleton(Node& node, std::uint8_t marker, std::size_t offset);
  void readInteger(Node& node, Cursor& object, std::uint8_t width);
  void readReal(Node& node, Cursor& object, std::uint8_t width, std::size_t offset);
  void readDate(Node& node, Cursor& object, std::uint8_t width, std::size_t offset);
  void readBytes(Node& node, Type type, Cursor& object, std::uint64_t length);
  void readUtf16(Node& node, Cursor& object, std::uint64_t units);
  void openContainer(Node& node, Type type, Cursor& object, std::uint32_t number,
                     std::uint64_t count);
  std::uint64_t readCount(Cursor& object, std::uint8_t low);
  Bytes claim(Cursor& object, std::uint64_t length);

  Store& store_;
  LongKeys keys_;
  std::size_t offsetSize_ = 0;
  std::size_t tableStart_ = 0;
  // What is left of the bytes that objects may claim.
  std::uint64_t claimable_ = 0;
  std::size_t depth_ = 0;
  // 16 KiB, whatever the message nests: no recursion that a message could drive.
  std::array<Frame, Limits::nestedContainers> frames_;
};

void BinaryReader::read() {
  readTrailer();
  enter(store_.top);
  while (depth_ > 0) {
    Frame& frame = frames_[depth_ - 1];
    if (frame.next < frame.end) {
      follow(frame);
    } else {
      leave(frame);
    }
  }
  keys_.checkDeferred();
}

// Deliberate: the unused bytes are not looked at, nor is what may lie between the offset table and
// the trailer: nothing reaches it.
void BinaryReader::readTrailer() {
  const Bytes message = store_.message;
  if (!Cursor(message).skipIf(magic)) throw Damage(Problem::notPropertyList, 0);
  if (message.size() < magic.size() + trailerLength) {
    throw Damage(Problem::truncated, message.size());
  }
  const std::size_t tableEnd = message.size() - trailerLength;
  Cursor trailer(message, tableEnd, message.size());
  trailer.take(trailerUnused);
  offsetSize_ = trailer.byte();
  store_.referenceSize = trailer.byte();
  const std::uint64_t objects = trailer.bigEndian(8);
  const std::uint64_t top = trailer.bigEndian(8);
  const std::uint64_t table = trailer.bigEndian(8);
  const bool sizesFit = offsetSize_ >= 1 && offsetSize_ <= 8 && store_.referenceSize >= 1 &&
                        store_.referenceSize <= 8;
  // Divided, because a product of two of these could wrap. What passes has no more objects than the
  // message has bytes, so the numbers below fit 32 bits.
  if (!sizesFit || top >= objects || table < magic.size() || table > tableEnd ||
      objects > (tableEnd - table) / offsetSize_) {
    throw Damage(Problem::trailer, tableEnd);
  }
  // An object takes at least a byte of offset table, so the nodes are at most 16 times the message.
  tableStart_ = static_cast<std::size_t>(table);
  store_.top = static_cast<std::uint32_t>(top);
  // Zero bytes are a node that was not visited.
  store_.nodes.zero(static_cast<std::size_t>(objects));
  claimable_ = Limits::claimedBase + Limits::claimedFactor * message.size();
}

// Walks one reference. Heights make the limit exact although every object is walked once: a chain
// of containers that is joined lower down counts by what it was found to be.
void BinaryReader::follow(Frame& frame) {
  const std::size_t position = frame.next;
  const std::uint64_t number = Cursor::bigEndianAt(store_.message, position, store_.referenceSize);
  if (number >= store_.nodes.size()) throw Damage(Problem::referenceOutOfRange, position);
  frame.next += store_.referenceSize;

  Node& node = store_.nodes[static_cast<std::size_t>(number)];
  // Open is every container on the stack, and none beside.
  if (node.has(Node::open)) throw Damage(Problem::selfContaining, position);
  if (node.has(Node::done)) {
    node.set(Node::shared);
    if (depth_ + node.height > Limits::nestedContainers) throw Damage(Problem::tooDeep, position);
    frame.highest = std::max(frame.highest, node.height);
  } else {
    enter(static_cast<std::uint32_t>(number));
  }
  if (position < frame.keysEnd && node.type != Type::string) {
    throw Damage(Problem::keyNotString, position);
  }
}

// All children are checked: the container is, too.
void BinaryReader::leave(const Frame& frame) {
  Node& node = store_.nodes[frame.number];
  node.height = static_cast<std::uint16_t>(frame.highest + 1);
  node.flags = static_cast<std::uint8_t>((node.flags & ~Node::open) | Node::done);
  if (node.type == Type::dictionary) keys_.check(frame.number);
  --depth_;
  if (depth_ > 0) frames_[depth_ - 1].highest = std::max(frames_[depth_ - 1].highest, node.height);
}

// Reads the object of this number, for the first time. A container becomes the innermost frame.
void BinaryReader::enter(std::uint32_t number) {
  // Inside the table, since the number is below the count that the table was checked for.
  const std::uint64_t offset =
      Cursor::bigEndianAt(store_.message, tableStart_ + number * offsetSize_, offsetSize_);
  if (offset < magic.size() || offset >= tableStart_) {
    throw Damage(Problem::objectOutside, tableStart_ + number * offsetSize_);
  }
  Cursor object(store_.message, static_cast<std::size_t>(offset), tableStart_);
  Node& node = store_.nodes[number];
  const std::uint8_t marker = object.byte();
  // A container takes it back until it is left.
  node.set(Node::done);
  readObject(node, number, object, marker);
}

void BinaryReader::readObject(Node& node, std::uint32_t number, Cursor& object,
                              std::uint8_t marker) {
  const std::size_t offset = object.position() - 1;
  const auto low = static_cast<std::uint8_t>(marker & 0x0F);
  switch (marker >> 4) {
    case 0x0:
      return readSingleton(node, marker, offset);
    case 0x1:
      return readInteger(node, object, low);
    case 0x2:
      return readReal(node, object, low, offset);
    case 0x3:
      return readDate(node, object, low, offset);
    case 0x4:
      return readBytes(node, Type::data, object, readCount(object, low));
    case 0x5:
      return readBytes(node, Type::string, object, readCount(object, low));
    case 0x6:
      return readUtf16(node, object, readCount(object, low));
    case 0x8:
      return readBytes(node, Type::uid, object, low + 1u);
    case 0xA:
      return openContainer(node, Type::array, object, number, readCount(object, low));
    case 0xC:
      return openContainer(node, Type::set, object, number, readCount(object, low));
    case 0xD:
      return openContainer(node, Type::dictionary, object, number, readCount(object, low));
    default:
      throw Damage(Problem::unknownMarker, offset);
  }
}

void BinaryReader::readSingleton(Node& node, std::uint8_t marker, std::size_t offset) {
  switch (marker) {
    case 0x00:
      node.type = Type::null;
      return;
    case 0x08:
      node.type = Type::boolean;
      return;
    case 0x09:
      node.type = Type::boolean;
      node.bits = 1;
      return;
    default:
      throw Damage(Problem::unknownMarker, offset);
  }
}

void BinaryReader::readInteger(Node& node, Cursor& object, std::uint8_t width) {
  const std::size_t start = object.position();
  // 1, 2, 4, 8 or 16 bytes. The narrow ones have no sign, 8 and 16 bytes do.
  if (width > 4) throw Damage(Problem::unknownMarker, start - 1);
  node.type = Type::integer;
  // Of 16 bytes the upper half may only repeat what the lower half says.
  const std::uint64_t upper = width == 4 ? object.bigEndian(8) : 0;
  node.bits = object.bigEndian(std::min<std::size_t>(8, std::size_t{1} << width));
  const bool topBit = (node.bits >> 63) != 0;
  if (width >= 3 && topBit && (width == 3 || upper == ~std::uint64_t{0})) {
    node.set(Node::negative);
  } else if (upper != 0) {
    throw Damage(Problem::integerTooLarge, start);
  }
}

// A real keeps any value, NaN included: what may be stored where is for the reader of the field.
void BinaryReader::readReal(Node& node, Cursor& object, std::uint8_t width, std::size_t offset) {
  node.type = Type::real;
  if (width == 2) {
    const auto single = std::bit_cast<float>(static_cast<std::uint32_t>(object.bigEndian(4)));
    node.bits = std::bit_cast<std::uint64_t>(static_cast<double>(single));
  } else if (width == 3) {
    node.bits = object.bigEndian(8);
  } else {
    throw Damage(Problem::unknownMarker, offset);
  }
}

void BinaryReader::readDate(Node& node, Cursor& object, std::uint8_t width, std::size_t offset) {
  if (width != 3) throw Damage(Problem::unknownMarker, offset);
  node.type = Type::date;
  node.bits = object.bigEndian(8);
  if (!std::isfinite(std::bit_cast<double>(node.bits))) {
    throw Damage(Problem::dateNotFinite, offset);
  }
}

void BinaryReader::readBytes(Node& node, Type type, Cursor& object, std::uint64_t length) {
  const std::size_t start = object.position();
  const Bytes bytes = claim(object, length);
  if (type == Type::string && !Text::isAscii(Cursor::textAt(store_.message, start, bytes.size())))
    throw Damage(Problem::notAscii, start);
  node.type = type;
  node.bits = start;
  node.count = static_cast<std::uint32_t>(length);
}

// Converted once here, so that every string is one view ever after.
void BinaryReader::readUtf16(Node& node, Cursor& object, std::uint64_t units) {
  const std::size_t start = object.position();
  if (units > object.remaining() / 2) throw Damage(Problem::objectOutside, start);
  const Bytes bytes = claim(object, 2 * units);
  // The most that UTF-8 can need, then cut to what it did need.
  const std::size_t side = store_.side.size();
  store_.side.resize(side + 3 * static_cast<std::size_t>(units));
  const std::size_t length = utf8FromUtf16(bytes, store_.side.data() + side);
  // Half a pair has no UTF-8, and whatever stood in for it could make two keys equal.
  if (length == failed) throw Damage(Problem::straySurrogate, start);
  if (length > Limits::messageLength) throw Damage(Problem::messageTooLarge, start);
  store_.side.resize(side + length);
  node.type = Type::string;
  node.set(Node::inSide);
  node.bits = side;
  node.count = static_cast<std::uint32_t>(length);
}

// Children are walked later, from the frame; here only their references are known to be there.
void BinaryReader::openContainer(Node& node, Type type, Cursor& object, std::uint32_t number,
                                 std::uint64_t count) {
  const std::size_t start = object.position();
  const std::size_t references = type == Type::dictionary ? 2 : 1;
  if (count > object.remaining() / (references * store_.referenceSize)) {
    throw Damage(Problem::objectOutside, start);
  }
  if (depth_ == Limits::nestedContainers) throw Damage(Problem::tooDeep, start);
  const std::size_t keysLength = static_cast<std::size_t>(count) * store_.referenceSize;
  const std::size_t end = start + claim(object, references * keysLength).size();
  node.type = type;
  node.bits = start;
  node.count = static_cast<std::uint32_t>(count);
  node.flags = Node::open;
  // Open until it is left: a reference to it from below closes a circle.
  frames_[depth_++] = {.number = number,
                       .highest = 0,
                       .next = start,
                       .keysEnd = type == Type::dictionary ? start + keysLength : start,
                       .end = end};
}

// Deliberate: a count is read as unsigned at all widths. A negative one is then vast, and fails
// where it is compared with what remains.
std::uint64_t BinaryReader::readCount(Cursor& object, std::uint8_t low) {
  if (low != 0x0F) return low;
  const std::size_t position = object.position();
  const std::uint8_t marker = object.byte();
  // 1 to 8 bytes: no count needs 16.
  if (marker < 0x10 || marker > 0x13) throw Damage(Problem::badCount, position);
  return object.bigEndian(std::size_t{1} << (marker & 0x0F));
}

// Every variable-length object takes its bytes here, so that objects which overlap are charged.
Bytes BinaryReader::claim(Cursor& object, std::uint64_t length) {
  const std::size_t position = object.position();
  const Bytes bytes = object.take(length);
  if (length > claimable_) throw Damage(Problem::overlappingObjects, position);
  claimable_ -= length;
  return bytes;
}

}  // namespace

void readBinary(Store& store) {
  BinaryReader(store).read();
}

}  // namespace PropertyList
