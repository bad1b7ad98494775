// SPDX-License-Identifier: Apache-2.0
/// The command numbers that the framework knows. Not all are served: the program's tables say which
/// service answers which command.
///
/// Values and pure functions; callable from any thread. Nothing throws.
#pragma once

#include <keelgate/enumeration.h>
#include <keelgate/values.h>

#include <string_view>

namespace Keelgate {

/// A known command; an unknown one cannot be represented. A client message's number is checked
/// against this list before its bytes are read. Numbers travel: never renumber a case.
class CommandType {
 public:
  KEELGATE_NESTED_ENUMERATION(Case, UInt64,
      (sampleMessage, 1),
      (sampleReply, 2),
      (checkInStart, 3),
      (checkInUpdate, 4),
      (checkInEnd, 5),
      (sessionPrepare, 231),
      (sessionInvitation, 232),
      (sessionAccept, 233),
      (sessionDecline, 234),
      (sessionCancel, 235),
      (sessionMessage, 236),
      (sessionDeclineElsewhere, 237),
      (sessionReinitiate, 238),
      (sessionEnd, 239),
      (livePhoto, 245));

  /// The command with this number, or nothing when the framework does not know it.
  static constexpr Optional<CommandType> fromRawValue(UInt64 rawValue) {
    const Optional<Case> known = Keelgate::fromRawValue<Case>(rawValue);
    if (!known) return std::nullopt;
    return CommandType(*known);
  }

  /// Implicit, so that a case can stand wherever a command is wanted.
  constexpr CommandType(Case which) : which_(which) {}

  /// The number that travels, and the name of the case as it is spelt above. The text lives as long
  /// as the program.
  [[nodiscard]] constexpr UInt64 rawValue() const { return rawValueOf(which_); }
  [[nodiscard]] constexpr std::string_view name() const { return nameOf(which_); }

  bool operator==(const CommandType&) const = default;

 private:
  Case which_;
};

}  // namespace Keelgate
