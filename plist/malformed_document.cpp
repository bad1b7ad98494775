// SPDX-License-Identifier: Apache-2.0
/// The sentences say what is wrong with a message, never what was in it: they go into replies and
/// logs.
#include "plist/malformed_document.h"

#include "plist/cursor.h"

#include <array>

namespace PropertyList {
namespace {

struct Reason {
  Problem problem;
  std::string_view text;
};

/// In the order of the enumerators.
constexpr auto reasons = std::to_array<Reason>({
    {Problem::empty, "the message is empty"},
    {Problem::compressed, "the message is gzip-compressed and must be decompressed first"},
    {Problem::utf16, "the message is UTF-16, and XML is read as UTF-8 only"},
    {Problem::otherVersion, "the binary format has another version than 00"},
    {Problem::notPropertyList, "the message is neither binary nor XML"},
    {Problem::messageTooLarge, "the message is larger than 4 GiB"},
    {Problem::truncated, "the message ends too early"},
    {Problem::trailer, "the trailer does not fit the message"},
    {Problem::objectOutside, "an object lies outside the object area"},
    {Problem::unknownMarker, "an object has an unknown marker"},
    {Problem::badCount, "an object's count is not an integer"},
    {Problem::integerTooLarge, "an integer does not fit 64 bits"},
    {Problem::dateNotFinite, "a date is not finite"},
    {Problem::notAscii, "an ASCII string holds another character"},
    {Problem::straySurrogate, "a UTF-16 string holds a stray surrogate"},
    {Problem::referenceOutOfRange, "a reference names no object"},
    {Problem::keyNotString, "a dictionary's key is not a string"},
    {Problem::duplicateKey, "a dictionary has the same key twice"},
    {Problem::selfContaining, "a container contains itself"},
    {Problem::tooDeep, "containers are nested too deeply"},
    {Problem::overlappingObjects, "objects overlap beyond what the message's size can justify"},
    {Problem::excessiveExpansion,
     "shared objects expand beyond what the message's size can justify"},
    {Problem::badUtf8, "the text is not valid UTF-8"},
    {Problem::forbiddenCharacter, "the text holds a character that XML forbids"},
    {Problem::badReference, "an entity or character reference is not allowed"},
    {Problem::badDeclaration, "the XML declaration is malformed or not for UTF-8"},
    {Problem::badDocumentType, "the document type is malformed or has a subset"},
    {Problem::badComment, "a comment is malformed"},
    {Problem::badInstruction, "a processing instruction is malformed or misplaced"},
    {Problem::badTag, "a tag is malformed"},
    {Problem::duplicateAttribute, "a tag has the same attribute twice"},
    {Problem::unknownElement, "an element is unknown"},
    {Problem::misplacedElement, "an element stands where it may not"},
    {Problem::mismatchedEnd, "an end tag does not match its element"},
    {Problem::strayText, "text stands where only elements may"},
    {Problem::missingValue, "a value is missing"},
    {Problem::badInteger, "an integer is misspelt or does not fit 64 bits"},
    {Problem::badReal, "a real is misspelt or out of range"},
    {Problem::badDate, "a date is misspelt or not in the calendar"},
    {Problem::badBase64, "data is not base64 with full padding"},
});

constexpr bool isInOrder() noexcept {
  for (std::size_t i = 0; i < reasons.size(); ++i) {
    if (static_cast<std::size_t>(reasons[i].problem) != i) return false;
  }
  return reasons.back().problem == Problem::badBase64;
}
static_assert(isInOrder(), "a problem without its reason, or out of order");

/// What the reader takes for text, and a person sees in an editor.
bool isText(Problem problem, std::string_view message) noexcept {
  return !message.starts_with("bplist") && problem != Problem::empty &&
         problem != Problem::compressed && problem != Problem::utf16;
}

}  // namespace

std::string_view reason(Problem problem) noexcept {
  return reasons[static_cast<std::size_t>(problem)].text;
}

std::string describe(const MalformedDocument& error, Bytes message) {
  const std::string_view text = Cursor(message).rest();
  std::string place;
  if (isText(error.problem(), text)) {
    std::size_t line = 1;
    std::size_t lineStart = 0;
    for (std::size_t at = 0; at < error.offset(); ++at) {
      // A line ends as XML says: with a line feed, a carriage return, or one of each.
      const bool isPair = text[at] == '\r' && at + 1 < text.size() && text[at + 1] == '\n';
      if ((text[at] != '\n' && text[at] != '\r') || isPair) continue;
      ++line;
      lineStart = at + 1;
    }
    const std::size_t column = error.offset() - lineStart + 1;
    place = "line " + std::to_string(line) + ", column " + std::to_string(column);
  } else {
    place = "byte " + std::to_string(error.offset() + 1);
  }
  return "Malformed property list at " + place + ": " + error.what() + ".";
}

}  // namespace PropertyList
