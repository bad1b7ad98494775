// SPDX-License-Identifier: Apache-2.0
// Reads XML property lists: the elements, their order and their values.
//
// The stack of open containers is explicit and of fixed size. Nodes are made in document order, so
// a container is closed by noting where the table has come to.
#include <algorithm>
#include <array>
#include <bit>

#include "plist/damage.h"
#include "plist/duplicates.h"
#include "plist/limits.h"
#include "plist/store.h"
#include "plist/xml_scalars.h"
#include "plist/xml_scanner.h"

namespace PropertyList {
namespace {

enum class Element : std::uint8_t {
  string,
  key,
  integer,
  real,
  date,
  data,
  yes,
  no,
  array,
  dictionary
};

// In the order of the enumerators.
constexpr std::array<std::string_view, 10> names = {"string", "key",  "integer", "real",  "date",
                                                    "data",   "true", "false",   "array", "dict"};

class XmlReader {
 public:
  explicit XmlReader(Store& store) noexcept
      : store_(store), scanner_(store.message, store.side), cursor_(scanner_.cursor()) {}

  void read();

 private:
  struct Frame {
    std::uint32_t number;
    std::uint32_t children;  // of a dictionary: keys and values
  };

  void readValue();
  void readElement();
  Element elementHere();
  void place(Element element);
  void openContainer(Type type, bool isEmpty);
  void closeContainer();
  void checkKeys(std::uint32_t dictionary);
  void readContent(Element element, bool isEmpty);
  void addText(const XmlScanner::Text& text);
  void addData(const XmlScanner::Text& text);
  void addNumber(Element element, const XmlScanner::Text& text);
  std::string_view view(const XmlScanner::Text& text) const;
  Node& add(Type type, std::uint64_t bits, std::uint32_t count = 0);

  Store& store_;
  XmlScanner scanner_;
  Cursor& cursor_;
  SmallBuffer<std::string_view, 64> keys_;
  std::size_t depth_ = 0;
  std::array<Frame, Limits::nestedContainers> frames_;
};

// One root, one value in it, and nothing but comments, instructions and space around.
void XmlReader::read() {
  scanner_.prolog();
  if (!cursor_.skipIf("<plist")) {
    scanner_.fail(cursor_.peek() == '<' ? Problem::unknownElement : Problem::notPropertyList);
  }
  scanner_.attributes();
  if (cursor_.skipIf("/>")) scanner_.fail(Problem::missingValue);
  if (!cursor_.skipIf(">")) scanner_.fail(Problem::badTag);
  scanner_.miscellany();
  if (cursor_.rest().starts_with("</")) scanner_.fail(Problem::missingValue);
  readValue();
  scanner_.miscellany();
  scanner_.endTag("plist");
  scanner_.miscellany();
  if (!cursor_.atEnd()) scanner_.fail(Problem::strayText);
}

void XmlReader::readValue() {
  readElement();
  while (depth_ > 0) {
    scanner_.miscellany();
    if (cursor_.peek() == '<' && cursor_.peek(1) == '/') {
      closeContainer();
    } else {
      readElement();
    }
  }
}

void XmlReader::readElement() {
  if (cursor_.atEnd()) scanner_.fail(Problem::truncated);
  if (!cursor_.skipIf("<")) scanner_.fail(Problem::strayText);
  const Element element = elementHere();
  place(element);
  if (cursor_.peek() != '>' && cursor_.peek() != '/') scanner_.attributes();
  const bool isEmpty = cursor_.skipIf("/");
  if (!cursor_.skipIf(">")) scanner_.fail(Problem::badTag);
  if (element == Element::array) return openContainer(Type::array, isEmpty);
  if (element == Element::dictionary) return openContainer(Type::dictionary, isEmpty);
  readContent(element, isEmpty);
}

Element XmlReader::elementHere() {
  const auto is = [this](Element element, std::string_view name) {
    if (!cursor_.skipIf(name)) scanner_.fail(Problem::unknownElement);
    return element;
  };
  // The first letter, or the fourth, tells which one it can be.
  switch (cursor_.peek()) {
    case 'k':
      return is(Element::key, "key");
    case 's':
      return is(Element::string, "string");
    case 'i':
      return is(Element::integer, "integer");
    case 'r':
      return is(Element::real, "real");
    case 't':
      return is(Element::yes, "true");
    case 'f':
      return is(Element::no, "false");
    case 'a':
      return is(Element::array, "array");
    default:
      if (cursor_.peek(3) == 't') return is(Element::dictionary, "dict");
      return cursor_.peek(3) == 'a' ? is(Element::data, "data") : is(Element::date, "date");
  }
}

// In a dictionary keys and values take turns; elsewhere there are no keys.
void XmlReader::place(Element element) {
  bool isKeyDue = false;
  if (depth_ > 0) {
    Frame& frame = frames_[depth_ - 1];
    isKeyDue = store_.nodes[frame.number].type == Type::dictionary && frame.children % 2 == 0;
    ++frame.children;
  }
  if (isKeyDue != (element == Element::key)) scanner_.fail(Problem::misplacedElement);
}

void XmlReader::openContainer(Type type, bool isEmpty) {
  if (depth_ == Limits::nestedContainers) scanner_.fail(Problem::tooDeep);
  const auto number = static_cast<std::uint32_t>(store_.nodes.size());
  add(type, number + std::uint64_t{1});
  if (!isEmpty) frames_[depth_++] = {.number = number, .children = 0};
}

// The end tag is checked against what is open here, so elements cannot cross.
void XmlReader::closeContainer() {
  const Frame frame = frames_[--depth_];
  Node& node = store_.nodes[frame.number];
  const bool isDictionary = node.type == Type::dictionary;
  scanner_.endTag(isDictionary ? "dict" : "array");
  node.bits = store_.nodes.size();
  node.count = isDictionary ? frame.children / 2 : frame.children;
  if (!isDictionary) return;
  if (frame.children % 2 != 0) scanner_.fail(Problem::missingValue);
  checkKeys(frame.number);
}

// XML shares nothing: all keys together are no longer than the message, whatever their number.
void XmlReader::checkKeys(std::uint32_t dictionary) {
  keys_.clear();
  std::size_t key = dictionary + std::size_t{1};
  for (std::uint32_t i = 0; i < store_.nodes[dictionary].count; ++i) {
    keys_.push(store_.text(store_.nodes[key]));
    key = store_.after(key + 1);
  }
  if (hasDuplicates(keys_.all())) scanner_.fail(Problem::duplicateKey);
}

void XmlReader::readContent(Element element, bool isEmpty) {
  XmlScanner::Text text{cursor_.position(), 0, false};
  const std::size_t side = store_.side.size();
  if (!isEmpty) text = scanner_.text(names[static_cast<std::size_t>(element)]);
  switch (element) {
    case Element::string:
    case Element::key:
      return addText(text);
    case Element::data:
      return addData(text);
    case Element::yes:
    case Element::no:
      if (text.length > 0) scanner_.fail(Problem::strayText);
      add(Type::boolean, element == Element::yes ? 1 : 0);
      return;
    default:
      addNumber(element, text);
  }
  // What was assembled for a number is of no more use.
  store_.side.resize(side);
}

void XmlReader::addText(const XmlScanner::Text& text) {
  Node& node = add(Type::string, text.offset, static_cast<std::uint32_t>(text.length));
  if (text.inSide) node.set(Node::inSide);
}

void XmlReader::addData(const XmlScanner::Text& text) {
  const std::size_t start = text.inSide ? text.offset : store_.side.size();
  // Assembled text is decoded where it stands: what comes out is shorter than what went in.
  if (!text.inSide) store_.side.resize(start + text.length / 4 * 3 + 3);
  const auto length = decodeBase64(view(text), store_.side.data() + start);
  if (!length) scanner_.fail(Problem::badBase64);
  store_.side.resize(start + *length);
  add(Type::data, start, static_cast<std::uint32_t>(*length)).set(Node::inSide);
}

void XmlReader::addNumber(Element element, const XmlScanner::Text& text) {
  if (element == Element::integer) {
    const auto integer = parseInteger(view(text));
    if (!integer) scanner_.fail(Problem::badInteger);
    Node& node = add(Type::integer, integer->bits);
    if (integer->negative) node.set(Node::negative);
    return;
  }
  // Two elements, one node each: both are a double.
  const bool isDate = element == Element::date;
  const auto number = isDate ? parseDate(view(text)) : parseReal(view(text));
  if (!number) scanner_.fail(isDate ? Problem::badDate : Problem::badReal);
  add(isDate ? Type::date : Type::real, std::bit_cast<std::uint64_t>(*number));
}

std::string_view XmlReader::view(const XmlScanner::Text& text) const {
  if (text.inSide) return {store_.side.data() + text.offset, text.length};
  return Cursor::textAt(store_.message, text.offset, text.length);
}

// The table grows to what the message's part so far lets expect, with some room: few copies, and
// no memory out of proportion to the message.
Node& XmlReader::add(Type type, std::uint64_t bits, std::uint32_t count) {
  SmallBuffer<Node, 128>& nodes = store_.nodes;
  if (nodes.size() == nodes.capacity()) {
    const std::size_t expected = nodes.size() * store_.message.size() / (cursor_.position() + 1);
    nodes.reserve(std::max(expected, nodes.size()) + nodes.size() / 2);
  }
  nodes.push({.bits = bits, .count = count, .height = 0, .type = type, .flags = 0});
  return nodes[nodes.size() - 1];
}

}  // namespace

void readXml(Store& store) {
  XmlReader(store).read();
}

}  // namespace PropertyList
