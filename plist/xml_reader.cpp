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
#include "plist/xml_elements.h"
#include "plist/xml_scalars.h"
#include "plist/xml_scanner.h"
#include "text/base64.h"

namespace PropertyList {
namespace {

constexpr Spelling root = {"plist", ShortText("plist>"), ShortText("plist>")};

constexpr bool isBoolean(Element element) noexcept {
  return element == Element::yes || element == Element::no;
}

class XmlReader {
 public:
  explicit XmlReader(Store& store) noexcept : store_(store), scanner_(store.message, store.side) {}

  void read();

 private:
  struct Frame {
    std::uint32_t number;
    std::uint32_t children;  // of a dictionary: keys and values
    bool isDictionary;

    bool isKeyDue() const noexcept { return isDictionary && children % 2 == 0; }
  };

  Cursor& cursor() noexcept { return scanner_.cursor(); }
  void readValue();
  bool readUsual();
  void readElement();
  void readBody(Element element, bool isEmpty);
  Element elementHere();
  void place(Element element);
  void openContainer(Type type, bool isEmpty);
  void closeContainer();
  void checkKeys(std::uint32_t dictionary);
  XmlScanner::Content content(Element element, bool isEmpty);
  void addText(const XmlScanner::Content& text);
  void addData(bool isEmpty);
  void addNumber(Element element, bool isEmpty);
  std::string_view view(const XmlScanner::Content& text) const;
  Node& add(Type type, std::uint64_t bits, std::uint32_t count = 0);
  [[gnu::noinline]] void growNodes();

  Store& store_;
  XmlScanner scanner_;
  SmallBuffer<std::string_view, 64> keys_;
  std::size_t depth_ = 0;
  // As in the binary reader: fixed, so that depth is a number that is compared and not a stack that
  // overflows.
  std::array<Frame, Limits::nestedContainers> frames_;
};

// One root, one value in it, and nothing but comments, instructions and space around.
void XmlReader::read() {
  scanner_.prolog();
  // As most writers spell it, at a stroke.
  if (!cursor().skipIf("<plist version=\"1.0\">")) {
    if (!cursor().skipIf("<plist")) {
      scanner_.fail(cursor().peek() == '<' ? Problem::unknownElement : Problem::notPropertyList);
    }
    scanner_.attributes();
    if (cursor().skipIf("/>")) scanner_.fail(Problem::missingValue);
    if (!cursor().skipIf(">")) scanner_.fail(Problem::badTag);
  }
  scanner_.miscellany();
  if (cursor().rest().starts_with("</")) scanner_.fail(Problem::missingValue);
  readValue();
  scanner_.miscellany();
  scanner_.endTag(root);
  scanner_.miscellany();
  if (!cursor().atEnd()) scanner_.fail(Problem::strayText);
}

void XmlReader::readValue() {
  readElement();
  while (depth_ > 0) {
    cursor().skipSpace();
    if (readUsual()) continue;
    scanner_.miscellany();
    if (cursor().peek() == '<' && cursor().peek(1) == '/') {
      closeContainer();
    } else {
      readElement();
    }
  }
}

// Reads an element whose start tag is spelt as most writers do and stands where it may. Whatever
// else is here stays untouched, so that one place alone finds what is wrong with it.
bool XmlReader::readUsual() {
  if (cursor().peek() != '<') return false;
  const std::uint64_t word = cursor().word(1);
  const Element element = elementTable.candidate(word);
  const ShortText& start = spellingOf(element).start;
  Frame& frame = frames_[depth_ - 1];
  if (!start.begins(word) || frame.isKeyDue() != (element == Element::key)) return false;
  ++frame.children;
  cursor().skip(1 + start.length);
  readBody(element, isBoolean(element));
  return true;
}

void XmlReader::readElement() {
  if (cursor().atEnd()) scanner_.fail(Problem::truncated);
  if (!cursor().skipIf("<")) scanner_.fail(Problem::strayText);
  const Element element = elementHere();
  place(element);
  if (cursor().peek() != '>' && cursor().peek() != '/') scanner_.attributes();
  const bool isEmpty = cursor().skipIf("/");
  if (!cursor().skipIf(">")) scanner_.fail(Problem::badTag);
  readBody(element, isEmpty);
}

// What follows a start tag.
void XmlReader::readBody(Element element, bool isEmpty) {
  switch (element) {
    case Element::string:
    case Element::key:
      return addText(content(element, isEmpty));
    case Element::data:
      return addData(isEmpty);
    case Element::yes:
    case Element::no:
      if (content(element, isEmpty).length > 0) scanner_.fail(Problem::strayText);
      add(Type::boolean, element == Element::yes ? 1 : 0);
      return;
    case Element::array:
      return openContainer(Type::array, isEmpty);
    case Element::dictionary:
      return openContainer(Type::dictionary, isEmpty);
    default:
      addNumber(element, isEmpty);
  }
}

Element XmlReader::elementHere() {
  const auto is = [this](Element element, std::string_view name) {
    if (!cursor().skipIf(name)) scanner_.fail(Problem::unknownElement);
    return element;
  };
  // The first letter, or the fourth, tells which one it can be.
  switch (cursor().peek()) {
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
      if (cursor().peek(3) == 't') return is(Element::dictionary, "dict");
      return cursor().peek(3) == 'a' ? is(Element::data, "data") : is(Element::date, "date");
  }
}

// In a dictionary keys and values take turns; elsewhere there are no keys.
void XmlReader::place(Element element) {
  bool isKeyDue = false;
  if (depth_ > 0) {
    Frame& frame = frames_[depth_ - 1];
    isKeyDue = frame.isKeyDue();
    ++frame.children;
  }
  if (isKeyDue != (element == Element::key)) scanner_.fail(Problem::misplacedElement);
}

void XmlReader::openContainer(Type type, bool isEmpty) {
  // Empty ones count: a limit that depends on the spelling would be none.
  if (depth_ == Limits::nestedContainers) scanner_.fail(Problem::tooDeep);
  const auto number = static_cast<std::uint32_t>(store_.nodes.size());
  add(type, number + std::uint64_t{1});
  if (isEmpty) return;
  frames_[depth_++] = {.number = number, .children = 0, .isDictionary = type == Type::dictionary};
}

// The end tag is checked against what is open here, so elements cannot cross.
void XmlReader::closeContainer() {
  const Frame frame = frames_[--depth_];
  Node& node = store_.nodes[frame.number];
  const bool isDictionary = frame.isDictionary;
  scanner_.endTag(spellingOf(isDictionary ? Element::dictionary : Element::array));
  node.bits = store_.nodes.size();
  node.count = isDictionary ? frame.children / 2 : frame.children;
  if (!isDictionary) return;
  // A key without a value. Looked at last, so that a wrong end tag is told as such.
  if (frame.children % 2 != 0) scanner_.fail(Problem::missingValue);
  checkKeys(frame.number);
}

// XML shares nothing: all keys together are no longer than the message, whatever their number.
void XmlReader::checkKeys(std::uint32_t dictionary) {
  keys_.clear();
  // No more than are there: the count is of what was read.
  keys_.reserve(store_.nodes[dictionary].count);
  std::size_t key = dictionary + std::size_t{1};
  for (std::uint32_t i = 0; i < store_.nodes[dictionary].count; ++i) {
    keys_.push(store_.text(store_.nodes[key]));
    key = store_.after(key + 1);
  }
  if (hasDuplicates(keys_.all())) scanner_.fail(Problem::duplicateKey);
}

// The text of an element and its end tag; nothing where the start tag was all.
XmlScanner::Content XmlReader::content(Element element, bool isEmpty) {
  if (isEmpty) return {cursor().position(), 0, false};
  return scanner_.text(spellingOf(element));
}

void XmlReader::addText(const XmlScanner::Content& text) {
  Node& node = add(Type::string, text.offset, static_cast<std::uint32_t>(text.length));
  if (text.inSide) node.set(Node::inSide);
}

// Assembled text is decoded where it stands: what comes out is shorter than what went in.
void XmlReader::addData(bool isEmpty) {
  const XmlScanner::Content text = content(Element::data, isEmpty);
  const std::size_t start = text.inSide ? text.offset : store_.side.size();
  store_.side.resize(start + Text::base64Room(text.length));
  const auto length =
      Text::decodeBase64(view(text), store_.side.data() + start, Text::Base64::spaced);
  if (!length) scanner_.fail(Problem::badBase64);
  // The buffer gives back what the encoding, white space and padding took.
  store_.side.resize(start + *length);
  add(Type::data, start, static_cast<std::uint32_t>(*length)).set(Node::inSide);
}

void XmlReader::addNumber(Element element, bool isEmpty) {
  const std::size_t side = store_.side.size();
  const XmlScanner::Content text = content(element, isEmpty);
  if (element == Element::integer) {
    const auto integer = parseInteger(view(text));
    if (!integer) scanner_.fail(Problem::badInteger);
    Node& node = add(Type::integer, integer->bits);
    if (integer->negative) node.set(Node::negative);
  } else {
    // Two elements, one node each: both are a double.
    const bool isDate = element == Element::date;
    const auto number = isDate ? parseDate(view(text)) : parseReal(view(text));
    if (!number) scanner_.fail(isDate ? Problem::badDate : Problem::badReal);
    add(isDate ? Type::date : Type::real, std::bit_cast<std::uint64_t>(*number));
  }
  // What was assembled for a number is of no more use.
  store_.side.resize(side);
}

std::string_view XmlReader::view(const XmlScanner::Content& text) const {
  if (text.inSide) return {store_.side.data() + text.offset, text.length};
  return Cursor::textAt(store_.message, text.offset, text.length);
}

Node& XmlReader::add(Type type, std::uint64_t bits, std::uint32_t count) {
  SmallBuffer<Node, 128>& nodes = store_.nodes;
  if (nodes.size() == nodes.capacity()) growNodes();
  nodes.push({.bits = bits, .count = count, .height = 0, .type = type, .flags = 0});
  return nodes[nodes.size() - 1];
}

// The table grows to what the message's part so far lets expect, with some room: few copies, and
// no memory out of proportion to the message.
void XmlReader::growNodes() {
  SmallBuffer<Node, 128>& nodes = store_.nodes;
  const std::size_t expected = nodes.size() * store_.message.size() / (cursor().position() + 1);
  nodes.reserve(std::max(expected, nodes.size()) + nodes.size() / 2);
}

}  // namespace

void readXml(Store& store) {
  XmlReader(store).read();
}

}  // namespace PropertyList
