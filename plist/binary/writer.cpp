// SPDX-License-Identifier: Apache-2.0
/// The trees here are our own, so this is plain code with ordinary containers.
#include <bit>
#include <cmath>
#include <limits>
#include <span>
#include <stdexcept>
#include <unordered_map>

#include "plist/writer.h"
#include "text/utf8.h"

namespace PropertyList {
namespace {

/// The widths that integers have. Offsets and references may have others, and are given these.
std::size_t widthFor(std::uint64_t largest) noexcept {
  return largest <= 0xFF ? 1 : largest <= 0xFFFF ? 2 : largest <= 0xFFFF'FFFF ? 4 : 8;
}

void appendBigEndian(std::string& out, std::uint64_t number, std::size_t width) {
  for (std::size_t i = width; i-- > 0;) out.push_back(static_cast<char>(number >> (8 * i)));
}

std::string encodedInteger(std::uint64_t bits, bool isSigned) {
  std::string out;
  const bool topBit = (bits >> 63) != 0;
  if (topBit && !isSigned) {
    // As 8 bytes it would be read as negative.
    out.push_back('\x14');
    appendBigEndian(out, 0, 8);
    appendBigEndian(out, bits, 8);
    return out;
  }
  const std::size_t width = widthFor(bits);
  out.push_back(static_cast<char>(0x10 + std::countr_zero(width)));
  appendBigEndian(out, bits, width);
  return out;
}

std::string encodedDouble(char marker, double number) {
  std::string out(1, marker);
  appendBigEndian(out, std::bit_cast<std::uint64_t>(number), 8);
  return out;
}

/// A marker with its count, which follows as an integer object when 4 bits are too few.
std::string encodedHead(unsigned marker, std::size_t count) {
  std::string out(1, static_cast<char>(marker | (count < 15 ? count : 15)));
  if (count >= 15) out += encodedInteger(count, true);
  return out;
}

/// As ASCII where it is, since that takes half the bytes.
std::string encodedString(std::string_view text) {
  if (Text::isAscii(text)) {
    return encodedHead(0x50, text.size()).append(text);
  }
  std::string units;
  while (!text.empty()) {
    const Text::Character next = Text::firstCharacter(text);
    if (next.length == 0) throw std::invalid_argument("A string is not valid UTF-8");
    text.remove_prefix(next.length);
    if (next.codePoint >= 0x10000) {
      appendBigEndian(units, 0xD800 + ((next.codePoint - 0x10000) >> 10), 2);
      appendBigEndian(units, 0xDC00 + (next.codePoint & 0x3FF), 2);
    } else {
      appendBigEndian(units, next.codePoint, 2);
    }
  }
  return encodedHead(0x60, units.size() / 2) + units;
}

/// The bytes of a scalar; nothing for a container.
struct Encode {
  std::string operator()(std::nullptr_t) const { return std::string(1, '\0'); }
  std::string operator()(bool boolean) const { return std::string(1, boolean ? '\x09' : '\x08'); }
  std::string operator()(std::int64_t number) const {
    return encodedInteger(static_cast<std::uint64_t>(number), true);
  }
  std::string operator()(std::uint64_t number) const { return encodedInteger(number, false); }
  std::string operator()(double number) const { return encodedDouble('\x23', number); }
  std::string operator()(Date date) const {
    if (!std::isfinite(date.seconds)) throw std::invalid_argument("A date is not finite");
    return encodedDouble('\x33', date.seconds);
  }
  std::string operator()(const std::string& text) const { return encodedString(text); }
  std::string operator()(const Data& data) const {
    std::string out = encodedHead(0x40, data.size());
    for (const std::byte byte : data) out.push_back(std::to_integer<char>(byte));
    return out;
  }
  std::string operator()(Uid uid) const {
    const std::size_t width = widthFor(uid.number);
    std::string out(1, static_cast<char>(0x80 + width - 1));
    appendBigEndian(out, uid.number, width);
    return out;
  }
  std::string operator()(const Array&) const { return {}; }
  std::string operator()(const Dictionary&) const { return {}; }
  std::string operator()(const Set&) const { return {}; }
};

class BinaryWriter {
 public:
  std::vector<std::byte> write(const Tree& tree);

 private:
  struct Object {
    const Tree* container;  // or null
    std::string head;       // a container's marker and count, or all of a scalar
    std::vector<std::size_t> references;
  };

  std::size_t number(const Tree& tree);
  std::size_t numberOfScalar(std::string encoded);
  void refer(std::size_t container);
  std::vector<std::byte> assembled() const;

  std::vector<Object> objects_;
  // By their bytes: what a reader cannot tell apart is one object.
  std::unordered_map<std::string, std::size_t> scalars_;
};

/// Equal bytes are one object, whatever types they came from.
std::size_t BinaryWriter::numberOfScalar(std::string encoded) {
  const auto [place, isNew] = scalars_.emplace(encoded, objects_.size());
  if (isNew) objects_.push_back({nullptr, std::move(encoded), {}});
  return place->second;
}

std::size_t BinaryWriter::number(const Tree& tree) {
  std::string encoded = std::visit(Encode{}, tree.value);
  if (!encoded.empty()) return numberOfScalar(std::move(encoded));
  objects_.push_back({&tree, {}, {}});
  return objects_.size() - 1;
}

/// Numbers a container's children. The list of objects may move meanwhile, so the container is
/// looked up again afterwards.
void BinaryWriter::refer(std::size_t container) {
  const Tree::Variant& value = objects_[container].container->value;
  std::vector<std::size_t> references;
  std::string head;
  if (const auto* entries = std::get_if<Dictionary>(&value)) {
    head = encodedHead(0xD0, entries->size());
    for (const auto& entry : *entries)
      references.push_back(numberOfScalar(encodedString(entry.first)));
    for (const auto& entry : *entries) references.push_back(number(entry.second));
  } else {
    const auto* set = std::get_if<Set>(&value);
    const Array& elements = set != nullptr ? set->elements : std::get<Array>(value);
    head = encodedHead(set != nullptr ? 0xC0 : 0xA0, elements.size());
    for (const Tree& element : elements) references.push_back(number(element));
  }
  objects_[container].head = std::move(head);
  objects_[container].references = std::move(references);
}

std::vector<std::byte> BinaryWriter::assembled() const {
  std::string out = "bplist00";
  // Both widths are known only now: they depend on how many objects there are, and how long.
  const std::size_t referenceSize = widthFor(objects_.size() - 1);
  std::vector<std::size_t> offsets;
  for (const Object& object : objects_) {
    offsets.push_back(out.size());
    out += object.head;
    for (const std::size_t target : object.references) appendBigEndian(out, target, referenceSize);
  }
  const std::size_t table = out.size();
  const std::size_t offsetSize = widthFor(table);
  for (const std::size_t offset : offsets) appendBigEndian(out, offset, offsetSize);
  out.append(6, '\0');
  out.push_back(static_cast<char>(offsetSize));
  out.push_back(static_cast<char>(referenceSize));
  appendBigEndian(out, objects_.size(), 8);
  appendBigEndian(out, 0, 8);
  appendBigEndian(out, table, 8);
  const auto bytes = std::as_bytes(std::span(out));
  return {bytes.begin(), bytes.end()};
}

std::vector<std::byte> BinaryWriter::write(const Tree& tree) {
  number(tree);
  // Breadth first: the list of objects is its own queue, so no depth of tree needs a stack.
  for (std::size_t i = 0; i < objects_.size(); ++i) {
    if (objects_[i].container != nullptr) refer(i);
  }
  return assembled();
}

}  // namespace

std::vector<std::byte> writeBinary(const Tree& tree) {
  return BinaryWriter().write(tree);
}

}  // namespace PropertyList
