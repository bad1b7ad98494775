// SPDX-License-Identifier: Apache-2.0
/// The errors that are thrown when a message gives no record.
///
/// A rejected message throws the very error that its unpacker threw inside the sandbox, with all of
/// its fields; a failure of the host itself throws HostError. Errors are values: copy them freely,
/// and use separate ones from separate threads.
///
/// Sentences, descriptions and reasons can quote what the message or its sender chose. They are
/// valid UTF-8 and may contain anything else: escape them before they reach a terminal or a log.
#pragma once

#include <keelgate/command_type.h>
#include <keelgate/enumeration.h>
#include <keelgate/export.h>
#include <keelgate/values.h>

#include <cstddef>
#include <exception>
#include <utility>
#include <variant>

namespace Keelgate {

/// What the errors share: what() gives one readable English sentence, valid as long as the error.
class KEELGATE_API Error : public std::exception {
 public:
  /// Owned by the error. For people: programs use the fields of the derived classes.
  [[nodiscard]] const char* what() const noexcept override { return sentence_.c_str(); }

 protected:
  explicit Error(String sentence) : sentence_(std::move(sentence)) {}

 private:
  String sentence_;
};

/// A step of a coding path: a wire key, or a position in an array. Positions count from 0.
using CodingKey = std::variant<String, std::size_t>;

/// The message does not have the form that its schema demands.
class KEELGATE_API DecodingError : public Error {
 public:
  KEELGATE_NESTED_ENUMERATION(Kind, std::uint8_t,
      /// A required key is missing: `key` names it, `codingPath` leads to the dictionary without it.
      (keyNotFound, 0),
      /// A value has another type than its field; `codingPath` leads to the value.
      (typeMismatch, 1),
      /// A null stands where a value is required; `codingPath` leads to it.
      (valueNotFound, 2),
      /// The bytes are not a well-formed property list (`codingPath` is empty), or a value of the
      /// right type is not one that its field accepts (`codingPath` leads to it).
      (dataCorrupted, 3));

  /// For code that decodes messages or replies; applications only receive these errors.
  DecodingError(Kind itsKind, Optional<String> itsKey, Array<CodingKey> itsPath,
                String itsDescription);

  Kind kind;
  /// The wire key that is missing; present only with keyNotFound.
  Optional<String> key;
  /// Outermost first. At most 512 steps, which is as deep as property lists nest. An honest service
  /// takes the keys from its schemas; one that was taken over writes what it likes.
  Array<CodingKey> codingPath;
  /// What is wrong, without the path; in English, for people.
  String debugDescription;
};

/// A rule of the framework or of the program was broken.
class KEELGATE_API Breach : public Error {
 public:
  Breach(String itsDomain, String itsErrorType, Optional<String> itsKeyPath = std::nullopt);

  /// Which part refused, e.g. "com.tessen.Keelgate.VespServiceUnpacker".
  String domain;
  /// The reason, for people.
  String errorType;
  Optional<String> keyPath;
};

/// The host gave the message up; nothing is known about its content. The message may be faultless,
/// for example when the machine is overloaded. A message that had a process to itself is never
/// retried.
class KEELGATE_API HostError : public Error {
 public:
  /// For programs, which may treat them differently: timedOut and crashed say nothing about the
  /// next message, startFailed does.
  KEELGATE_NESTED_ENUMERATION(Reason, std::uint8_t,
      /// The process that held the message died.
      (crashed, 0),
      /// No answer within the time limit.
      (timedOut, 1),
      /// The message is larger than the client's limit; it was not sent.
      (messageTooLarge, 2),
      /// Decoding needed more memory than the message's size justifies.
      (resourcesExhausted, 3),
      /// The service answered with something that is not an answer.
      (protocolViolation, 4),
      /// The service could not be started, or cannot be sealed on this system.
      (startFailed, 5));

  /// An empty description stands for the reason's own sentence.
  HostError(Reason itsReason, String itsDescription);

  Reason reason;
  /// Details for people, or the reason's own sentence if there are none.
  String description;
};

}  // namespace Keelgate

namespace VespKeelgateService {

/// The program has no unpacker for the message. Nothing of the message was decoded.
class KEELGATE_API VespClientMessageUnpackingError : public Keelgate::Error {
 public:
  KEELGATE_NESTED_ENUMERATION(Case, std::uint8_t,
      /// `command` is known to the framework, and the service has no schema for it.
      (unimplementedCommand, 0),
      /// No unpacker serves `service`, which is the identifier as it was received.
      (noUnpackerForService, 1));

  /// The only ways to make one, so that each case has its field set.
  static VespClientMessageUnpackingError unimplementedCommand(Keelgate::CommandType command);
  static VespClientMessageUnpackingError noUnpackerForService(Keelgate::String service);

  /// The same for both cases; together with `code` it identifies the case in other languages.
  static constexpr const char* domain = "VespKeelgateService.VespClientMessageUnpackingError";

  /// The position of the case.
  [[nodiscard]] int code() const noexcept { return static_cast<int>(which); }

  Case which;
  /// Present only with unimplementedCommand.
  Keelgate::Optional<Keelgate::CommandType> command;
  /// Present only with noUnpackerForService.
  Keelgate::Optional<Keelgate::String> service;

 private:
  VespClientMessageUnpackingError(Case itsCase,
                                  Keelgate::Optional<Keelgate::CommandType> itsCommand,
                                  Keelgate::Optional<Keelgate::String> itsService,
                                  Keelgate::String sentence);
};

}  // namespace VespKeelgateService
