// SPDX-License-Identifier: Apache-2.0
/// The lexical layer of XML: text, references, comments, instructions, tags and the prolog.
///
/// Everything is checked as it is passed, also where the content is ignored: nothing in a message
/// is skipped by searching for its end. No entity is ever declared, so none can expand, and nothing
/// names a file or an address that would be fetched.
///
/// A resource of one reading; one thread. Every function that moves throws MalformedDocument.
#pragma once

#include "plist/cursor.h"
#include "plist/malformed_document.h"
#include "plist/small_buffer.h"
#include "plist/xml/elements.h"

#include <cstddef>
#include <string_view>

namespace PropertyList {

class XmlScanner {
 public:
  /// Reads the message's text; text that does not stand in the message as it is meant, because of
  /// references, CDATA or line ends, is assembled at the end of `side`.
  XmlScanner(Bytes message, SmallBuffer<char, 512>& side) noexcept
      : cursor_(message), side_(side) {}

  /// For the reader of elements, which tests and passes tags by itself.
  Cursor& cursor() noexcept { return cursor_; }
  const Cursor& cursor() const noexcept { return cursor_; }

  /// Byte order mark, XML declaration and document type, with what may stand around them.
  void prolog();
  /// White space, comments and instructions, in any number.
  void miscellany() {
    cursor_.skipSpace();
    const char second = cursor_.peek(1);
    if (second == '!' || second == '?') markup();
  }
  /// Passes '<' and the name if all of the name is this; says whether it was.
  bool startTag(const ShortText& name) noexcept {
    const std::uint64_t word = cursor_.word(1);
    // No name takes all of the word.
    const auto next = static_cast<char>(word >> (8 * name.length) & 0xff);
    const bool isWhole = next == '>' || next == '/' || Text::isSpace(next);
    if (cursor_.peek() != '<' || !name.begins(word) || !isWhole) return false;
    cursor_.skip(1 + name.length);
    return true;
  }
  /// The end of a start tag, behind its name; says whether the element ends with it. Attributes
  /// mean nothing here.
  bool startTagEnd() {
    if (cursor_.peek() == '>') {
      cursor_.skip(1);
      return false;
    }
    return unusualStartTagEnd();
  }
  /// A closing "</name>" with white space where XML allows it.
  void endTag(const ShortText& name) {
    if (!skipEndTag(name)) fail(cursor_.atEnd() ? Problem::truncated : Problem::mismatchedEnd);
  }

  /// The text that stands here, up to the end tag of that name, which is passed. A position and no
  /// view, because assembling the next text may move the side buffer.
  struct Content {
    std::size_t position;  // in the message or in the side buffer
    std::size_t length;
    bool inSide;
  };
  Content text(const ShortText& name) {
    const std::size_t start = cursor_.position();
    cursor_.skipPlain();
    const std::size_t end = cursor_.position();
    if (!skipEndTag(name)) return unusualText(name, start);
    return {start, end - start, false};
  }

  [[noreturn]] void fail(Problem problem) const { failAt(problem, cursor_.position()); }
  [[noreturn]] void failAt(Problem problem, std::size_t position) const {
    throw MalformedDocument(problem, position);
  }

 private:
  /// Leaves the cursor where it was unless all of the tag stands here.
  bool skipEndTag(const ShortText& name) noexcept {
    constexpr ShortText beginning("</");
    if (!beginning.begins(cursor_.word(0)) || !name.begins(cursor_.word(2))) return false;
    const Cursor start = cursor_;
    cursor_.skip(2 + name.length);
    if (cursor_.peek() != '>') cursor_.skipSpace();
    const bool isWhole = cursor_.peek() == '>';
    if (isWhole) cursor_.skip(1);
    if (!isWhole) cursor_ = start;
    return isWhole;
  }
  bool unusualStartTagEnd();
  void attributes();
  Content unusualText(const ShortText& name, std::size_t start);
  /// Each passes one construct whole, and fails with the problem of its name.
  void declaration();
  bool pseudoAttribute(std::string_view name, std::string_view& value);
  void documentType();
  void quoted(bool isPublic);
  void markup();
  void comment();
  void instruction();
  std::string_view name(Problem problem);
  void attributeValue();
  char32_t character();
  char32_t reference();
  char32_t characterReference();
  /// Text as it is meant is gathered by these at the end of the side buffer.
  void plainText();
  void assemble(std::size_t start);
  void section();
  void append(std::size_t start);
  void newline();

  Cursor cursor_;
  SmallBuffer<char, 512>& side_;
};

}  // namespace PropertyList
