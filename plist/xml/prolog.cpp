// SPDX-License-Identifier: Apache-2.0
/// What stands before the root element: byte order mark, declaration, document type.
#include "plist/xml/scanner.h"

#include <algorithm>

namespace PropertyList {
namespace {

constexpr std::string_view byteOrderMark = "\xEF\xBB\xBF";

constexpr bool isOneOf(char c, std::string_view characters) noexcept {
  return characters.find(c) != std::string_view::npos;
}

constexpr bool isLetterOrDigit(char c) noexcept {
  return Text::isLetter(c) || Text::isDigit(c);
}

/// Which characters a public identifier may have.
constexpr bool isPublicCharacter(char c) noexcept {
  return isLetterOrDigit(c) || isOneOf(c, " \r\n-'()+,./:=?;!*#@$_%");
}

/// The only encoding that is read, so a name for any other contradicts the message.
bool isUtf8(std::string_view encoding) noexcept {
  return std::ranges::equal(encoding, std::string_view("utf-8"), {}, Text::lowerCase);
}

/// Any 1.x is read as 1.0, as XML has it.
bool isVersion(std::string_view version) noexcept {
  return version.size() > 2 && version.starts_with("1.") &&
         std::ranges::all_of(version.substr(2), Text::isDigit);
}

}  // namespace

void XmlScanner::prolog() {
  cursor_.skipIf(byteOrderMark);
  // As most writers spell it, at a stroke.
  const bool isUsual = cursor_.skipIf("<?xml version=\"1.0\" encoding=\"UTF-8\"?>");
  // "<?xml-stylesheet" begins like the declaration and is an instruction.
  if (!isUsual && cursor_.rest().starts_with("<?xml") && isOneOf(cursor_.peek(5), " \t\r\n"))
    declaration();
  miscellany();
  if (cursor_.skipIf("<!DOCTYPE")) {
    documentType();
    miscellany();
  }
}

/// The three come in this order or not at all; the first is required.
void XmlScanner::declaration() {
  cursor_.skip(5);
  std::string_view value;
  if (!pseudoAttribute("version", value) || !isVersion(value)) fail(Problem::badDeclaration);
  if (pseudoAttribute("encoding", value) && !isUtf8(value)) fail(Problem::badDeclaration);
  if (pseudoAttribute("standalone", value) && value != "yes" && value != "no") {
    fail(Problem::badDeclaration);
  }
  cursor_.skipSpace();
  if (!cursor_.skipIf("?>")) fail(Problem::badDeclaration);
}

/// Passes ` name="value"` if that is what stands here.
bool XmlScanner::pseudoAttribute(std::string_view name, std::string_view& value) {
  const Cursor start = cursor_;
  if (!cursor_.skipSpace() || !cursor_.skipIf(name)) {
    cursor_ = start;
    return false;
  }
  cursor_.skipSpace();
  if (!cursor_.skipIf("=")) fail(Problem::badDeclaration);
  cursor_.skipSpace();
  const char quote = cursor_.peek();
  if (quote != '"' && quote != '\'') fail(Problem::badDeclaration);
  cursor_.skip(1);
  const std::size_t first = cursor_.position();
  while (isLetterOrDigit(cursor_.peek()) || isOneOf(cursor_.peek(), "._-")) cursor_.skip(1);
  value = cursor_.since(first);
  if (cursor_.peek() != quote) fail(Problem::badDeclaration);
  cursor_.skip(1);
  return true;
}

/// Past the "<!DOCTYPE". Its identifiers are checked for their characters and never looked up. An
/// internal subset could declare entities that expand without end, so there is none.
void XmlScanner::documentType() {
  if (!cursor_.skipSpace()) fail(Problem::badDocumentType);
  name(Problem::badDocumentType);
  if (cursor_.skipSpace()) {
    const bool isPublic = cursor_.skipIf("PUBLIC");
    if (isPublic) quoted(true);
    if (isPublic || cursor_.skipIf("SYSTEM")) quoted(false);
    cursor_.skipSpace();
  }
  if (!cursor_.skipIf(">")) fail(Problem::badDocumentType);
}

/// White space and an identifier in quotes.
void XmlScanner::quoted(bool isPublic) {
  if (!cursor_.skipSpace()) fail(Problem::badDocumentType);
  const char quote = cursor_.peek();
  if (quote != '"' && quote != '\'') fail(Problem::badDocumentType);
  cursor_.skip(1);
  while (cursor_.peek() != quote) {
    if (isPublic && !isPublicCharacter(cursor_.peek())) fail(Problem::badDocumentType);
    character();
  }
  cursor_.skip(1);
}

}  // namespace PropertyList
