// SPDX-License-Identifier: Apache-2.0
/// Reads XML property lists: the elements, their order and their values.
///
/// The stack of open containers is explicit and of fixed size. Nodes are made in document order, so
/// a container is closed by noting where the table has come to.
#include "plist/key_table.h"
#include "plist/limits.h"
#include "plist/store.h"
#include "plist/xml/elements.h"
#include "plist/xml/scalars.h"
#include "plist/xml/scanner.h"
#include "text/base64.h"

#include <array>
#include <bit>

namespace PropertyList {
namespace {

class XmlReader {
 public:
  explicit XmlReader(Store& store)
      : store_(store), scanner_(store.message, store.side), keys_(store) {}

  void read();

 private:
  struct Frame {
    std::uint32_t node;
    std::uint32_t children;  // of a dictionary: keys and values
    bool isDictionary;

    bool isKeyDue() const noexcept { return isDictionary && children % 2 == 0; }
  };
  using Content = XmlScanner::Content;

  Cursor& cursor() noexcept { return scanner_.cursor(); }
  const Cursor& cursor() const noexcept { return scanner_.cursor(); }
  void readValue();
  void readElement();
  Element readName();
  [[noreturn]] void refuseTag(Problem otherwise) const;
  void readBody(Element element, bool isEmpty);
  void openContainer(Type type, bool isEmpty);
  void closeContainer();
  void checkKeys(std::uint32_t dictionary, std::size_t end);
  Content content(Element element, bool isEmpty);
  void addText(const Content& text);
  void addData(const Content& text);
  void addInteger(const Content& text);
  void addDouble(Type type, const Content& text);
  std::string_view view(const Content& text) const;
  [[noreturn]] void refuse(Problem problem, const Content& text) const;

  Store& store_;
  XmlScanner scanner_;
  KeyTable keys_;
  std::size_t depth_ = 0;
  /// As in the binary reader: fixed, so that depth is a number that is compared and not a stack
  /// that overflows.
  std::array<Frame, Limits::nestedContainers> frames_;
};

/// One root, one value in it, and nothing but comments, instructions and space around.
void XmlReader::read() {
  scanner_.prolog();
  // As most writers spell it, at a stroke: a tenth of the time of a small message.
  if (!cursor().skipIf("<plist version=\"1.0\">")) {
    if (!scanner_.startTag(rootName)) refuseTag(Problem::notPropertyList);
    if (scanner_.startTagEnd()) scanner_.fail(Problem::missingValue);
  }
  scanner_.miscellany();
  if (cursor().rest().starts_with("</")) scanner_.fail(Problem::missingValue);
  readValue();
  scanner_.miscellany();
  scanner_.endTag(rootName);
  scanner_.miscellany();
  if (!cursor().atEnd()) scanner_.fail(Problem::strayText);
}

void XmlReader::readValue() {
  readElement();
  while (depth_ > 0) {
    scanner_.miscellany();
    if (cursor().peek() == '<' && cursor().peek(1) == '/') {
      closeContainer();
    } else {
      readElement();
    }
  }
}

void XmlReader::readElement() {
  // In a dictionary keys and values take turns; elsewhere there are no keys.
  bool isKeyDue = false;
  if (depth_ > 0) {
    Frame& frame = frames_[depth_ - 1];
    isKeyDue = frame.isKeyDue();
    ++frame.children;
  }
  // Half of all elements, and the only jump to their code that a processor foresees.
  constexpr ShortText keyTag("<key>");
  if (isKeyDue && keyTag.begins(cursor().word(0))) {
    cursor().skip(keyTag.length);
    return addText(scanner_.text(nameOf(Element::key)));
  }
  const std::size_t start = cursor().position();
  const Element element = readName();
  if (isKeyDue != (element == Element::key)) scanner_.failAt(Problem::misplacedElement, start);
  readBody(element, scanner_.startTagEnd());
}

Element XmlReader::readName() {
  const Element element = elementTable.candidate(cursor().word(1));
  if (!scanner_.startTag(nameOf(element))) refuseTag(Problem::strayText);
  return element;
}

/// What stands here is not the start tag of any element that may be here.
void XmlReader::refuseTag(Problem otherwise) const {
  const std::string_view rest = cursor().rest();
  if (!rest.starts_with('<') && !rest.empty()) scanner_.fail(otherwise);
  // A name that the message's end cuts short may have been any.
  const bool isCut = rest.find_first_of(" \t\r\n/>") == std::string_view::npos;
  scanner_.fail(isCut ? Problem::truncated : Problem::unknownElement);
}

/// What follows a start tag.
void XmlReader::readBody(Element element, bool isEmpty) {
  switch (element) {
    case Element::string:
    case Element::key:
      return addText(content(element, isEmpty));
    case Element::data:
      return addData(content(element, isEmpty));
    case Element::integer:
      return addInteger(content(element, isEmpty));
    case Element::real:
      return addDouble(Type::real, content(element, isEmpty));
    case Element::date:
      return addDouble(Type::date, content(element, isEmpty));
    case Element::array:
      return openContainer(Type::array, isEmpty);
    case Element::dictionary:
      return openContainer(Type::dictionary, isEmpty);
    case Element::yes:
    case Element::no: {
      const Content text = content(element, isEmpty);
      if (text.length > 0) refuse(Problem::strayText, text);
      store_.nodes.push({.bits = element == Element::yes, .type = Type::boolean});
    }
  }
}

void XmlReader::openContainer(Type type, bool isEmpty) {
  // Empty ones count: a limit that depends on the spelling would be none.
  if (depth_ == Limits::nestedContainers) scanner_.fail(Problem::tooDeep);
  const auto node = static_cast<std::uint32_t>(store_.nodes.size());
  store_.nodes.push({.bits = node + std::uint64_t{1}, .type = type});
  if (isEmpty) return;
  frames_[depth_++] = {.node = node, .children = 0, .isDictionary = type == Type::dictionary};
}

/// The end tag is checked against what is open here, so elements cannot cross.
void XmlReader::closeContainer() {
  const Frame& frame = frames_[--depth_];
  const std::size_t end = cursor().position();
  scanner_.endTag(nameOf(frame.isDictionary ? Element::dictionary : Element::array));
  // A key without a value. Looked at last, so that a wrong end tag is told as such.
  if (frame.isDictionary && !frame.isKeyDue()) scanner_.failAt(Problem::missingValue, end);
  Node& node = store_.nodes[frame.node];
  node.bits = store_.nodes.size();
  node.count = frame.isDictionary ? frame.children / 2 : frame.children;
  if (frame.isDictionary) checkKeys(frame.node, end);
}

/// Once all of the dictionary is read: dictionaries inside have keys of their own.
void XmlReader::checkKeys(std::uint32_t dictionary, std::size_t end) {
  const std::size_t count = store_.nodes[dictionary].count;
  keys_.begin(dictionary, count);
  std::size_t key = store_.firstChild(dictionary);
  for (std::size_t left = count; left > 0; --left, key = store_.nextKey(key)) {
    const Node& node = store_.nodes[key];
    // Assembled text stands nowhere in the message.
    keys_.add(static_cast<std::uint32_t>(key), keyDigest(store_.text(node)),
              node.has(Node::inSide) ? end : node.position());
  }
  keys_.end();
}

/// The text of an element and its end tag; nothing where the start tag was all.
XmlReader::Content XmlReader::content(Element element, bool isEmpty) {
  if (isEmpty) return {cursor().position(), 0, false};
  return scanner_.text(nameOf(element));
}

void XmlReader::addText(const Content& text) {
  if (store_.side.size() > Limits::length) scanner_.fail(Problem::messageTooLarge);
  Node node{.bits = text.position,
            .count = static_cast<std::uint32_t>(text.length),
            .type = Type::string};
  if (text.inSide) node.set(Node::inSide);
  store_.nodes.push(node);
}

/// Assembled text is decoded where it stands: what comes out is shorter than what went in.
void XmlReader::addData(const Content& text) {
  const std::size_t start = text.inSide ? text.position : store_.side.size();
  if (!text.inSide) store_.side.resize(start + Text::base64Room(text.length));
  const auto length =
      Text::decodeBase64(view(text), store_.side.data() + start, Text::Base64::spaced);
  if (!length) refuse(Problem::badBase64, text);
  // The buffer gives back what the encoding, white space and padding took.
  store_.side.resize(start + *length);
  store_.nodes.push({.bits = start,
                     .count = static_cast<std::uint32_t>(*length),
                     .type = Type::data,
                     .flags = Node::inSide});
}

void XmlReader::addInteger(const Content& text) {
  const auto integer = parseInteger(view(text));
  if (!integer) refuse(Problem::badInteger, text);
  Node node{.bits = integer->bits, .type = Type::integer};
  if (integer->negative) node.set(Node::negative);
  store_.nodes.push(node);
}

void XmlReader::addDouble(Type type, const Content& text) {
  const bool isDate = type == Type::date;
  const auto number = isDate ? parseDate(view(text)) : parseReal(view(text));
  if (!number) refuse(isDate ? Problem::badDate : Problem::badReal, text);
  store_.nodes.push({.bits = std::bit_cast<std::uint64_t>(*number), .type = type});
}

std::string_view XmlReader::view(const Content& text) const {
  if (text.inSide) return {store_.side.data() + text.position, text.length};
  return Cursor::textAt(store_.message, text.position, text.length);
}

/// Where the text begins, if it stands in the message; else behind it.
void XmlReader::refuse(Problem problem, const Content& text) const {
  if (text.inSide) scanner_.fail(problem);
  scanner_.failAt(problem, text.position);
}

}  // namespace

void readXml(Store& store) {
  XmlReader(store).read();
}

}  // namespace PropertyList
