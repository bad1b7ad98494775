// SPDX-License-Identifier: Apache-2.0
#include "plist/damage.h"

namespace PropertyList {

// Two functions, because one switch over all reasons would be longer than a screen.
static std::string_view sentenceOfMarkup(Problem problem) noexcept {
  switch (problem) {
    case Problem::badUtf8:
      return "The text is not valid UTF-8.";
    case Problem::forbiddenCharacter:
      return "The text holds a character that XML forbids.";
    case Problem::badReference:
      return "An entity or character reference is not allowed.";
    case Problem::badDeclaration:
      return "The XML declaration is malformed or not for UTF-8.";
    case Problem::badDocumentType:
      return "The document type is malformed or has a subset.";
    case Problem::badComment:
      return "A comment is malformed.";
    case Problem::badInstruction:
      return "A processing instruction is malformed or misplaced.";
    case Problem::badTag:
      return "A tag is malformed.";
    case Problem::duplicateAttribute:
      return "A tag has the same attribute twice.";
    case Problem::unknownElement:
      return "An element is unknown.";
    case Problem::misplacedElement:
      return "An element stands where it may not.";
    case Problem::mismatchedEnd:
      return "An end tag does not match its element.";
    case Problem::strayText:
      return "Text stands where only elements may.";
    case Problem::missingValue:
      return "A value is missing.";
    case Problem::badInteger:
      return "An integer is misspelt.";
    case Problem::badReal:
      return "A real is misspelt or out of range.";
    case Problem::badDate:
      return "A date is misspelt or not in the calendar.";
    case Problem::badBase64:
      return "Data is not base64 with full padding.";
    default:
      return "The property list is damaged.";
  }
}

std::string_view sentence(Problem problem) noexcept {
  switch (problem) {
    case Problem::messageTooLarge:
      return "The message is larger than 4 GiB.";
    case Problem::notPropertyList:
      return "The message is neither a binary nor an XML property list.";
    case Problem::truncated:
      return "The message ends too early.";
    case Problem::trailer:
      return "The trailer does not fit the message.";
    case Problem::objectOutside:
      return "An object lies outside the object area.";
    case Problem::unknownMarker:
      return "An object has an unknown marker.";
    case Problem::badCount:
      return "An object's count is not an integer.";
    case Problem::integerTooLarge:
      return "An integer does not fit 64 bits.";
    case Problem::dateNotFinite:
      return "A date is not finite.";
    case Problem::notAscii:
      return "An ASCII string holds another character.";
    case Problem::straySurrogate:
      return "A UTF-16 string holds a stray surrogate.";
    case Problem::referenceOutOfRange:
      return "A reference names no object.";
    case Problem::keyNotString:
      return "A dictionary's key is not a string.";
    case Problem::duplicateKey:
      return "A dictionary has the same key twice.";
    case Problem::selfContaining:
      return "A container contains itself.";
    case Problem::tooDeep:
      return "Containers are nested too deeply.";
    case Problem::overlappingObjects:
      return "Objects overlap beyond what the message can justify.";
    case Problem::excessiveExpansion:
      return "Shared objects expand beyond what the message can justify.";
    default:
      return sentenceOfMarkup(problem);
  }
}

}  // namespace PropertyList
