// SPDX-License-Identifier: Apache-2.0
/// Why a message is not a property list: one reason, and where it was found.
///
/// Values and pure functions; may be used from any thread.
#pragma once

#include "plist/bytes.h"

#include <cstddef>
#include <cstdint>
#include <exception>
#include <string>
#include <string_view>

namespace PropertyList {

/// One enumerator per reason. malformed_document.cpp gives each its sentence for people.
enum class Problem : std::uint8_t {
  empty,                // no bytes at all
  compressed,           // begins as gzip does
  utf16,                // text, but not in UTF-8
  otherVersion,         // binary, but not version 00
  notPropertyList,      // neither a binary nor an XML beginning
  messageTooLarge,      // positions would not fit 32 bits
  truncated,            // the message stops inside a construct
  trailer,              // the binary trailer contradicts itself or the message's length
  objectOutside,        // an object's extent leaves the object area
  unknownMarker,        // no object begins with this byte
  badCount,             // a count that is not an integer object
  integerTooLarge,      // 64 bits cannot hold it
  dateNotFinite,        // a binary date that is NaN or infinite
  notAscii,             // a byte above 0x7f in an ASCII string
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
  badInteger,           // not spelt as an integer, or out of range
  badReal,              // not spelt as a real, or out of a double's range
  badDate,              // not spelt as a date, or not in the calendar
  badBase64,            // not base64 with full padding
};

/// The reason as part of an English sentence. Static storage, zero-terminated.
std::string_view reason(Problem problem) noexcept;

/// Thrown by Document and ExpansionBudget, and by nothing else. Never with a text from the message:
/// what it says goes into replies and logs.
class MalformedDocument : public std::exception {
 public:
  MalformedDocument(Problem problem, std::size_t offset) noexcept
      : offset_(offset), problem_(problem) {}

  Problem problem() const noexcept { return problem_; }
  /// Position in the message where the problem was noticed, in bytes from 0; at most its length.
  std::size_t offset() const noexcept { return offset_; }
  const char* what() const noexcept override { return reason(problem_).data(); }

 private:
  std::size_t offset_;
  Problem problem_;
};

/// One sentence that says what is wrong and where: a byte in a binary message, a line and a column
/// in text, columns in bytes, all counted from 1. The message must be the one that was refused.
/// Throws std::bad_alloc.
std::string describe(const MalformedDocument& error, Bytes message);

}  // namespace PropertyList
