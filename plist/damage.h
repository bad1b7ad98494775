// SPDX-License-Identifier: Apache-2.0
// Why a message is no property list: one reason, and where it was found.
//
// Values; may be used from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <exception>
#include <string_view>

namespace PropertyList {

// One enumerator per reason. damage.cpp gives each its sentence for people.
enum class Problem : std::uint8_t {
  messageTooLarge,      // positions would not fit 32 bits
  notPropertyList,      // neither a binary nor an XML beginning
  truncated,            // the text stops inside a construct
  trailer,              // the binary trailer contradicts itself or the message's length
  objectOutside,        // an object's extent leaves the object area
  unknownMarker,        // no object begins with this byte
  badCount,             // a count that is no integer object
  integerTooLarge,      // 64 bits cannot hold it
  dateNotFinite,        // a binary date that is NaN or infinite
  notAscii,             // a byte above 0x7F in an ASCII string
  straySurrogate,       // half a pair in a UTF-16 string
  referenceOutOfRange,  // a reference to an object number that does not exist
  keyNotString,         // a dictionary key of another type
  duplicateKey,         // the same key twice in one dictionary
  selfContaining,       // a container that is reached from itself
  tooDeep,              // more nested containers than limits.h allows
  overlappingObjects,   // many objects that claim the same bytes
  excessiveExpansion,   // shared objects, read over and over
  badUtf8,              // malformed, overlong or surrogate UTF-8
  forbiddenCharacter,   // a character that XML excludes
  badReference,         // an entity or character reference that is not allowed
  badDeclaration,       // a malformed XML declaration, or an encoding other than UTF-8
  badDocumentType,      // a malformed document type, or one with an internal subset
  badComment,           // "--" inside, or no end
  badInstruction,       // a malformed or misplaced processing instruction
  badTag,               // a malformed tag or attribute
  duplicateAttribute,   // the same attribute twice in one tag
  unknownElement,       // an element that property lists do not have
  misplacedElement,     // an element where another is expected
  mismatchedEnd,        // an end tag for another element
  strayText,            // text where only elements may stand
  missingValue,         // a key without its value, or a document without any
  badInteger,           // not spelt as an integer
  badReal,              // not spelt as a real, or out of a double's range
  badDate,              // not spelt as a date, or not in the calendar
  badBase64,            // not base64 with full padding
};

// The reason in one English sentence, ending with a full stop. Static storage, zero-terminated.
std::string_view sentence(Problem problem) noexcept;

// Thrown by Document and ExpansionBudget, and by nothing else. Never with a text from the message:
// what it says goes into replies and logs.
class Damage : public std::exception {
 public:
  Damage(Problem problem, std::size_t offset) noexcept : offset_(offset), problem_(problem) {}

  Problem problem() const noexcept { return problem_; }
  // Byte position in the message near which the problem was noticed; 0 where it is the whole's.
  std::size_t offset() const noexcept { return offset_; }
  // The problem's sentence.
  const char* what() const noexcept override { return sentence(problem_).data(); }

 private:
  std::size_t offset_;
  Problem problem_;
};

}  // namespace PropertyList
