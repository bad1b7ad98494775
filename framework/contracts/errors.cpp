// SPDX-License-Identifier: Apache-2.0
/// The sentences of the errors. They are made where the error is thrown and again where it is
/// thrown anew, so that they need not travel.
#include <keelgate/errors.h>

namespace Keelgate {

namespace {

/// For people, so a key with a dot in it is not told from two keys.
String pathText(const Array<CodingKey>& path) {
  if (path.empty()) return {};
  String text = " (at ";
  for (std::size_t i = 0; i < path.size(); ++i) {
    if (i > 0) text += '.';
    if (const auto* index = std::get_if<std::size_t>(&path[i])) text += std::to_string(*index);
    if (const auto* key = std::get_if<String>(&path[i])) text += *key;
  }
  return text + ")";
}

const char* reasonText(HostError::Reason reason) {
  switch (reason) {
    case HostError::Reason::crashed:
      return "the process that held the message died";
    case HostError::Reason::timedOut:
      return "the message was not answered in time";
    case HostError::Reason::messageTooLarge:
      return "the message is larger than the limit";
    case HostError::Reason::resourcesExhausted:
      return "the message needs more memory than its size justifies";
    case HostError::Reason::protocolViolation:
      return "the service sent something that is not an answer";
    case HostError::Reason::startFailed:
      return "the service could not be started";
  }
  // A reason that is none of them, which only a cast can make.
  return "the host gave up";
}

}  // namespace

DecodingError::DecodingError(Kind itsKind, Optional<String> itsKey, Array<CodingKey> itsPath,
                             String itsDescription)
    : Error(itsDescription + pathText(itsPath)),
      kind(itsKind),
      key(std::move(itsKey)),
      codingPath(std::move(itsPath)),
      debugDescription(std::move(itsDescription)) {}

Breach::Breach(String itsDomain, String itsErrorType, Optional<String> itsKeyPath)
    : Error(itsErrorType + " [" + itsDomain + "]"),
      domain(std::move(itsDomain)),
      errorType(std::move(itsErrorType)),
      keyPath(std::move(itsKeyPath)) {}

HostError::HostError(Reason itsReason, String itsDescription)
    : Error(String(reasonText(itsReason)) + (itsDescription.empty() ? "" : ": ") + itsDescription),
      reason(itsReason),
      description(itsDescription.empty() ? String(reasonText(itsReason))
                                         : std::move(itsDescription)) {}

}  // namespace Keelgate

namespace VespKeelgateService {

VespClientMessageUnpackingError::VespClientMessageUnpackingError(
    Case itsCase, Keelgate::Optional<Keelgate::CommandType> itsCommand,
    Keelgate::Optional<Keelgate::String> itsService, Keelgate::String sentence)
    : Error(std::move(sentence)),
      which(itsCase),
      command(itsCommand),
      service(std::move(itsService)) {}

VespClientMessageUnpackingError VespClientMessageUnpackingError::unimplementedCommand(
    Keelgate::CommandType command) {
  return {Case::unimplementedCommand, command, std::nullopt,
          "the service does not implement command " + std::to_string(command.rawValue())};
}

VespClientMessageUnpackingError VespClientMessageUnpackingError::noUnpackerForService(
    Keelgate::String service) {
  Keelgate::String sentence = "no unpacker for the service \"" + service + "\"";
  return {Case::noUnpackerForService, std::nullopt, std::move(service), std::move(sentence)};
}

}  // namespace VespKeelgateService
