// SPDX-License-Identifier: Apache-2.0
/// Everything that is thrown when a message gives no record.
///
/// A rejected message throws the very error that its unpacker threw inside the sandbox, with all of
/// its fields; a failure of the host itself throws HostError. Errors are values: copy them freely,
/// use separate ones from separate threads.
#pragma once

#include <keelgate/command_type.h>
#include <keelgate/export.h>
#include <keelgate/values.h>

#include <cstddef>
#include <exception>
#include <string>
#include <utility>
#include <variant>

namespace Keelgate {

/// What the errors share: what() gives one readable English sentence, valid as long as the error.
class KEELGATE_API Error : public std::exception {
 public:
  [[nodiscard]] const char* what() const noexcept override { return sentence_.c_str(); }

 protected:
  explicit Error(String sentence) : sentence_(std::move(sentence)) {}

 private:
  String sentence_;
};

/// A step of a coding path: a wire key, or a position in an array.
using CodingKey = std::variant<String, std::size_t>;

/// The message does not have the form that its schema demands.
class KEELGATE_API DecodingError : public Error {
 public:
  enum class Kind : std::uint8_t {
    /// A required key is missing: `key` names it, `codingPath` leads to the dictionary without it.
    keyNotFound,
    /// A value has another type than its field; `codingPath` leads to the value.
    typeMismatch,
    /// A null stands where a value is required; `codingPath` leads to it.
    valueNotFound,
    /// The bytes are no well-formed property list (`codingPath` is empty), or a value of the right
    /// type is none that its field accepts (`codingPath` leads to it).
    dataCorrupted,
  };

  DecodingError(Kind itsKind, Optional<String> itsKey, Array<CodingKey> itsPath,
                String itsDescription);

  Kind kind;
  /// The wire key that is missing; present with keyNotFound alone.
  Optional<String> key;
  /// Outermost first.
  Array<CodingKey> codingPath;
  String debugDescription;
};

/// A rule of the framework or of the program was broken.
class KEELGATE_API Breach : public Error {
 public:
  Breach(String itsDomain, String itsErrorType, Optional<String> itsKeyPath = std::nullopt);

  String domain;
  /// The reason, for people.
  String errorType;
  Optional<String> keyPath;
};

/// The host gave the message up; nothing is known of its content.
class KEELGATE_API HostError : public Error {
 public:
  enum class Reason : std::uint8_t {
    /// The process that held the message died.
    crashed,
    /// No answer within the time limit.
    timedOut,
    /// The message is larger than the client's limit; it was not sent.
    messageTooLarge,
    /// Decoding needed more memory than the message's size justifies.
    resourcesExhausted,
    /// The service answered with something that is no answer.
    protocolViolation,
    /// The service could not be started, or cannot be sealed on this system.
    startFailed,
  };

  HostError(Reason itsReason, String itsDescription);

  Reason reason;
  String description;
};

}  // namespace Keelgate

namespace VespKeelgateService {

/// The program has no unpacker for the message.
class KEELGATE_API VespClientMessageUnpackingError : public Keelgate::Error {
 public:
  enum class Case : std::uint8_t {
    /// `command` is known to the framework, and the service has no schema for it.
    unimplementedCommand,
    /// No unpacker serves `service`, which is the identifier as it was received.
    noUnpackerForService,
  };

  static VespClientMessageUnpackingError unimplementedCommand(Keelgate::CommandType command);
  static VespClientMessageUnpackingError noUnpackerForService(Keelgate::String service);

  static constexpr const char* domain = "VespKeelgateService.VespClientMessageUnpackingError";

  /// The position of the case.
  [[nodiscard]] int code() const noexcept { return static_cast<int>(which); }

  Case which;
  /// Present with unimplementedCommand alone.
  Keelgate::Optional<Keelgate::CommandType> command;
  /// Present with noUnpackerForService alone.
  Keelgate::Optional<Keelgate::String> service;

 private:
  VespClientMessageUnpackingError(Case itsCase,
                                  Keelgate::Optional<Keelgate::CommandType> itsCommand,
                                  Keelgate::Optional<Keelgate::String> itsService,
                                  Keelgate::String sentence);
};

}  // namespace VespKeelgateService
