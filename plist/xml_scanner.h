// SPDX-License-Identifier: Apache-2.0
// The lexical layer of XML: text, references, comments, instructions, attributes and the prolog.
//
// Everything is checked as it is passed, also where the content is ignored: nothing in a message
// is skipped by searching for its end. No entity is ever declared, so none can expand, and nothing
// names a file or an address that would be fetched.
//
// A resource of one reading; one thread. Every function that moves throws Damage.
#pragma once

#include <cstddef>
#include <string_view>

#include "plist/cursor.h"
#include "plist/damage.h"
#include "plist/small_buffer.h"
#include "plist/xml_elements.h"

namespace PropertyList {

class XmlScanner {
 public:
  // Reads the message's text; text that does not stand in the message as it is meant, because of
  // references, CDATA or line ends, is assembled at the end of `side`.
  XmlScanner(Bytes message, SmallBuffer<char, 512>& side) noexcept
      : cursor_(message), side_(side) {}

  // For the reader of elements, which tests and passes tags by itself.
  Cursor& cursor() noexcept { return cursor_; }

  // Byte order mark, XML declaration and document type, with what may stand around them.
  void prolog();
  // White space, comments and instructions, in any number.
  void miscellany() {
    cursor_.skipSpace();
    const char second = cursor_.peek(1);
    if (second == '!' || second == '?') markup();
  }
  // The attributes of a start tag and white space, up to its '>' or "/>". They mean nothing here.
  void attributes();
  // A closing "</name>" with white space where XML allows it.
  void endTag(const Spelling& element) {
    if (!usualEndTag(element)) unusualEndTag(element.name);
  }

  // The text that stands here, up to the end tag of `element`, which is passed. An offset and no
  // view, because assembling the next text may move the side buffer.
  struct Content {
    std::size_t offset;  // in the message or in the side buffer
    std::size_t length;
    bool inSide;
  };
  Content text(const Spelling& element) {
    const std::size_t start = cursor_.position();
    cursor_.skipPlain();
    const std::size_t end = cursor_.position();
    if (!usualEndTag(element)) return unusualText(element, start);
    return {start, end - start, false};
  }

  // Where the cursor stands now, which is at or just behind the fault.
  [[noreturn]] void fail(Problem problem) const { throw Damage(problem, cursor_.position()); }

 private:
  // Leaves the cursor where it was unless the tag is spelt as most writers do.
  bool usualEndTag(const Spelling& element) noexcept {
    constexpr ShortText beginning("</");
    if (!beginning.begins(cursor_.word(0)) || !element.end.begins(cursor_.word(2))) return false;
    cursor_.skip(2 + element.end.length);
    return true;
  }
  void unusualEndTag(std::string_view name);
  Content unusualText(const Spelling& element, std::size_t start);
  // Each passes one construct whole, and fails with the problem of its name.
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
  // Text as it is meant is gathered by these at the end of the side buffer.
  void plainText();
  void assemble(std::size_t start);
  void section();
  void append(std::size_t start);
  void newline();

  Cursor cursor_;
  SmallBuffer<char, 512>& side_;
};

}  // namespace PropertyList
