// SPDX-License-Identifier: Apache-2.0
// The sentences say what is wrong with a message, never what was in it: they go into replies and
// logs.
#include "plist/damage.h"

#include <array>

namespace PropertyList {
namespace {

struct Reason {
  Problem problem;
  std::string_view sentence;
};

// In the order of the enumerators.
constexpr auto reasons = std::to_array<Reason>({
    {Problem::messageTooLarge, "The message is larger than 4 GiB."},
    {Problem::notPropertyList, "The message is neither a binary nor an XML property list."},
    {Problem::truncated, "The message ends too early."},
    {Problem::trailer, "The trailer does not fit the message."},
    {Problem::objectOutside, "An object lies outside the object area."},
    {Problem::unknownMarker, "An object has an unknown marker."},
    {Problem::badCount, "An object's count is not an integer."},
    {Problem::integerTooLarge, "An integer does not fit 64 bits."},
    {Problem::dateNotFinite, "A date is not finite."},
    {Problem::notAscii, "An ASCII string holds another character."},
    {Problem::straySurrogate, "A UTF-16 string holds a stray surrogate."},
    {Problem::referenceOutOfRange, "A reference names no object."},
    {Problem::keyNotString, "A dictionary's key is not a string."},
    {Problem::duplicateKey, "A dictionary has the same key twice."},
    {Problem::selfContaining, "A container contains itself."},
    {Problem::tooDeep, "Containers are nested too deeply."},
    {Problem::overlappingObjects, "Objects overlap beyond what the message can justify."},
    {Problem::excessiveExpansion, "Shared objects expand beyond what the message can justify."},
    {Problem::badUtf8, "The text is not valid UTF-8."},
    {Problem::forbiddenCharacter, "The text holds a character that XML forbids."},
    {Problem::badReference, "An entity or character reference is not allowed."},
    {Problem::badDeclaration, "The XML declaration is malformed or not for UTF-8."},
    {Problem::badDocumentType, "The document type is malformed or has a subset."},
    {Problem::badComment, "A comment is malformed."},
    {Problem::badInstruction, "A processing instruction is malformed or misplaced."},
    {Problem::badTag, "A tag is malformed."},
    {Problem::duplicateAttribute, "A tag has the same attribute twice."},
    {Problem::unknownElement, "An element is unknown."},
    {Problem::misplacedElement, "An element stands where it may not."},
    {Problem::mismatchedEnd, "An end tag does not match its element."},
    {Problem::strayText, "Text stands where only elements may."},
    {Problem::missingValue, "A value is missing."},
    {Problem::badInteger, "An integer is misspelt."},
    {Problem::badReal, "A real is misspelt or out of range."},
    {Problem::badDate, "A date is misspelt or not in the calendar."},
    {Problem::badBase64, "Data is not base64 with full padding."},
});

constexpr bool isInOrder() noexcept {
  for (std::size_t i = 0; i < reasons.size(); ++i) {
    if (static_cast<std::size_t>(reasons[i].problem) != i) return false;
  }
  return reasons.back().problem == Problem::badBase64;
}
static_assert(isInOrder(), "a reason without its sentence, or out of order");

}  // namespace

std::string_view sentence(Problem problem) noexcept {
  return reasons[static_cast<std::size_t>(problem)].sentence;
}

}  // namespace PropertyList
