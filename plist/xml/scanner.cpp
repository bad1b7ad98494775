// SPDX-License-Identifier: Apache-2.0
/// Text, references, tags' details, comments and instructions. The prolog is in prolog.cpp.
#include "plist/xml/scanner.h"

#include "plist/xml/characters.h"
#include "text/utf8.h"

#include <algorithm>
#include <array>

namespace PropertyList {

void XmlScanner::markup() {
  for (;;) {
    if (cursor_.skipIf("<!--")) {
      comment();
    } else if (cursor_.skipIf("<?")) {
      instruction();
    } else {
      return;
    }
    cursor_.skipSpace();
  }
}

/// Past the "<!--". "--" may only stand in its end.
void XmlScanner::comment() {
  while (!cursor_.skipIf("--")) character();
  if (!cursor_.skipIf(">")) fail(Problem::badComment);
}

/// Past the "<?". The target "xml" in any case is kept for the declaration.
void XmlScanner::instruction() {
  const std::string_view target = name(Problem::badInstruction);
  const auto isLetter = [&](std::size_t at, char lower) {
    return (target[at] | 0x20) == lower;
  };
  if (target.size() == 3 && isLetter(0, 'x') && isLetter(1, 'm') && isLetter(2, 'l')) {
    fail(Problem::badInstruction);
  }
  if (cursor_.skipIf("?>")) return;
  if (!cursor_.skipSpace()) fail(Problem::badInstruction);
  while (!cursor_.skipIf("?>")) character();
}

/// Passes one character of any kind and checks that XML admits it.
char32_t XmlScanner::character() {
  const char first = cursor_.peek();
  // Where char is unsigned, the bytes above ASCII are above a space too.
  if (first >= ' ' && first <= '~') {
    cursor_.skip(1);
    return static_cast<char32_t>(first);
  }
  if (cursor_.atEnd()) fail(Problem::truncated);
  // One decoder for all text: what one place takes for a character no other sees as bytes.
  const Text::Character next = Text::firstCharacter(cursor_.rest());
  if (next.length == 0) fail(Problem::badUtf8);
  if (!isXmlCharacter(next.codePoint)) fail(Problem::forbiddenCharacter);
  cursor_.skip(next.length);
  return next.codePoint;
}

/// A Name as XML has it; its colons mean nothing here.
std::string_view XmlScanner::name(Problem problem) {
  const std::size_t start = cursor_.position();
  while (!cursor_.atEnd()) {
    const Text::Character next = Text::firstCharacter(cursor_.rest());
    const bool isFirst = cursor_.position() == start;
    if (next.length == 0) fail(Problem::badUtf8);
    if (!(isFirst ? isXmlNameStart(next.codePoint) : isXmlNameCharacter(next.codePoint))) break;
    cursor_.skip(next.length);
  }
  if (cursor_.position() == start) fail(cursor_.atEnd() ? Problem::truncated : problem);
  return cursor_.since(start);
}

bool XmlScanner::unusualStartTagEnd() {
  if (cursor_.peek() != '/') attributes();
  const bool isEmpty = cursor_.skipIf("/");
  if (!cursor_.skipIf(">")) fail(cursor_.atEnd() ? Problem::truncated : Problem::badTag);
  return isEmpty;
}

/// The attributes of a start tag and white space, up to its '>' or '/'.
void XmlScanner::attributes() {
  // Gathered and compared once: a tag with a million attributes must not cost their square.
  SmallBuffer<std::string_view, 8> names;
  for (;;) {
    const bool separated = cursor_.skipSpace();
    const char next = cursor_.peek();
    if (next == '>' || next == '/') break;
    if (!separated) fail(cursor_.atEnd() ? Problem::truncated : Problem::badTag);
    names.push(name(Problem::badTag));
    cursor_.skipSpace();
    if (!cursor_.skipIf("=")) fail(Problem::badTag);
    cursor_.skipSpace();
    attributeValue();
  }
  const auto all = names.all();
  std::ranges::sort(all);
  if (std::ranges::adjacent_find(all) != all.end()) fail(Problem::duplicateAttribute);
}

/// Checked as if it mattered: an unclosed quote would swallow the tags after it.
void XmlScanner::attributeValue() {
  const char quote = cursor_.peek();
  if (quote != '"' && quote != '\'') fail(Problem::badTag);
  cursor_.skip(1);
  // A quote of the other kind is a character like any other.
  while (cursor_.peek() != quote) {
    if (cursor_.peek() == '<') fail(Problem::badTag);
    if (cursor_.skipIf("&")) {
      reference();
    } else {
      character();
    }
  }
  cursor_.skip(1);
}

/// Past the '&'.
char32_t XmlScanner::reference() {
  if (cursor_.skipIf("#")) return characterReference();
  struct Entity {
    std::string_view name;
    char32_t character;
  };
  static constexpr std::array<Entity, 5> entities = {
      {{"lt;", '<'}, {"gt;", '>'}, {"amp;", '&'}, {"quot;", '"'}, {"apos;", '\''}}};
  for (const Entity& entity : entities) {
    if (cursor_.skipIf(entity.name)) return entity.character;
  }
  // Only these five: with no declarations there is nothing else that a name could stand for.
  fail(Problem::badReference);
}

/// Past the "&#".
char32_t XmlScanner::characterReference() {
  const bool isHex = cursor_.skipIf("x");
  const char32_t base = isHex ? 16 : 10;
  const std::size_t start = cursor_.position();
  char32_t codePoint = 0;
  for (; cursor_.peek() != ';'; cursor_.skip(1)) {
    const char digit = cursor_.peek();
    const char letter = static_cast<char>(digit | 0x20);
    if (digit >= '0' && digit <= '9') {
      codePoint = codePoint * base + static_cast<char32_t>(digit - '0');
    } else if (isHex && letter >= 'a' && letter <= 'f') {
      codePoint = codePoint * base + static_cast<char32_t>(letter - 'a' + 10);
    } else {
      fail(Problem::badReference);
    }
    // At every digit, so that no number of digits can overflow.
    if (codePoint > 0x10FFFF) fail(Problem::badReference);
  }
  // Deliberate: a reference may name only what could also stand there plainly, so it smuggles in no
  // zero.
  if (cursor_.position() == start || !isXmlCharacter(codePoint)) fail(Problem::badReference);
  cursor_.skip(1);
  return codePoint;
}

/// Passes text that means what it says, up to a '<', '&' or carriage return.
void XmlScanner::plainText() {
  for (;;) {
    cursor_.skipPlain();
    const char next = cursor_.peek();
    if (next == '<' || next == '&' || next == '\r') return;
    if (cursor_.rest().starts_with("]]>")) fail(Problem::strayText);
    do {
      character();
    } while ((cursor_.peek() & 0x80) != 0);
  }
}

/// Most text stands in the message as it is meant, and stays there.
XmlScanner::Content XmlScanner::unusualText(const ShortText& name, std::size_t start) {
  plainText();
  if (cursor_.peek() == '<' && cursor_.peek(1) == '/') {
    const std::size_t length = cursor_.position() - start;
    endTag(name);
    return {start, length, false};
  }
  const std::size_t side = side_.size();
  assemble(start);
  endTag(name);
  return {side, side_.size() - side, true};
}

void XmlScanner::assemble(std::size_t start) {
  append(start);
  while (!cursor_.rest().starts_with("</")) {
    if (cursor_.skipIf("&")) {
      std::array<char, 4> bytes{};
      side_.append(bytes.data(), Text::encodeUtf8(reference(), bytes.data()));
    } else if (cursor_.peek() == '\r') {
      newline();
    } else if (cursor_.skipIf("<![CDATA[")) {
      section();
    } else if (cursor_.skipIf("<!--")) {
      comment();
    } else if (cursor_.skipIf("<?")) {
      instruction();
    } else {
      fail(Problem::misplacedElement);
    }
    const std::size_t piece = cursor_.position();
    plainText();
    append(piece);
  }
}

/// Past the "<![CDATA[": markup and references mean nothing, line ends still do.
void XmlScanner::section() {
  std::size_t piece = cursor_.position();
  while (!cursor_.rest().starts_with("]]>")) {
    if (cursor_.peek() == '\r') {
      append(piece);
      newline();
      piece = cursor_.position();
    } else {
      character();
    }
  }
  append(piece);
  cursor_.skip(3);
}

/// From the message as it stands, since that position.
void XmlScanner::append(std::size_t start) {
  const std::string_view piece = cursor_.since(start);
  side_.append(piece.data(), piece.size());
}

/// A carriage return, with or without a line feed, is one line end.
void XmlScanner::newline() {
  cursor_.skip(cursor_.peek(1) == '\n' ? 2 : 1);
  side_.push('\n');
}

}  // namespace PropertyList
