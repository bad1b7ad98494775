// SPDX-License-Identifier: Apache-2.0
/// An error travels as its kind and its fields; the sentence is made anew on the other side.
#include "framework/transport/error_coding.h"

namespace Keelgate::Transport {

using VespKeelgateService::VespClientMessageUnpackingError;

namespace {

/// Deliberate: the host's own error is none of them. What failed in the host is not for a worker to
/// say, least of all for one that was taken over.
enum class ErrorKind : std::uint8_t { decoding, breach, unpacking };

/// Its kind, and a number or the length of a key.
constexpr std::size_t smallestStep = 1 + sizeof(std::uint64_t);

Writer begin(ErrorKind kind) {
  Writer to;
  to.byte(static_cast<std::uint8_t>(kind));
  return to;
}

void writeOptional(Writer& to, const Optional<String>& text) {
  to.byte(text ? 1 : 0);
  if (text) to.text(*text);
}

Optional<String> readOptional(Reader& from) {
  if (!from.flag()) return std::nullopt;
  return String(from.text());
}

CodingKey readCodingKey(Reader& from) {
  if (from.flag()) return static_cast<std::size_t>(from.word());
  return String(from.text());
}

DecodingError readDecodingError(Reader& from) {
  const Optional<DecodingError::Kind> kind = fromRawValue<DecodingError::Kind>(from.byte());
  if (!kind) throw MalformedReply();
  Optional<String> key = readOptional(from);
  // A key that is missing is named, and nothing else is.
  if (key.has_value() != (kind == DecodingError::Kind::keyNotFound)) {
    throw MalformedReply();
  }
  const std::size_t steps = from.count(smallestStep);
  // An honest path is never longer: it has a step for each container that it leads through.
  if (steps > maximumNesting) throw MalformedReply();
  Array<CodingKey> path;
  if (steps > 0) from.charge(steps * sizeof(CodingKey));
  path.reserve(steps);
  for (std::size_t i = 0; i < steps; ++i) path.push_back(readCodingKey(from));
  return {*kind, std::move(key), std::move(path), String(from.text())};
}

Breach readBreach(Reader& from) {
  String domain(from.text());
  String errorType(from.text());
  return {std::move(domain), std::move(errorType), readOptional(from)};
}

VespClientMessageUnpackingError readUnpackingError(Reader& from) {
  if (from.flag()) {
    return VespClientMessageUnpackingError::noUnpackerForService(String(from.text()));
  }
  // An unknown number has no place in the error, whatever the other side says.
  const Optional<CommandType> command = CommandType::fromRawValue(from.word());
  if (!command) throw MalformedReply();
  return VespClientMessageUnpackingError::unimplementedCommand(*command);
}

template <class E>
[[noreturn]] void throwRead(Reader& from, E (*read)(Reader&)) {
  // Read whole before it is thrown: bytes behind it make it no error.
  E error = read(from);
  from.end();
  throw error;
}

}  // namespace

Data encodeError(const DecodingError& error) {
  Writer to = begin(ErrorKind::decoding);
  to.byte(static_cast<std::uint8_t>(error.kind));
  writeOptional(to, error.key);
  to.word(error.codingPath.size());
  for (const CodingKey& step : error.codingPath) {
    to.byte(static_cast<std::uint8_t>(step.index()));
    if (const auto* index = std::get_if<std::size_t>(&step)) to.word(*index);
    if (const auto* key = std::get_if<String>(&step)) to.text(*key);
  }
  to.text(error.debugDescription);
  return std::move(to).take().joined();
}

Data encodeError(const Breach& error) {
  Writer to = begin(ErrorKind::breach);
  to.text(error.domain);
  to.text(error.errorType);
  writeOptional(to, error.keyPath);
  return std::move(to).take().joined();
}

Data encodeError(const VespClientMessageUnpackingError& error) {
  Writer to = begin(ErrorKind::unpacking);
  to.byte(static_cast<std::uint8_t>(error.code()));
  if (error.command) to.word(error.command->rawValue());
  if (error.service) to.text(*error.service);
  return std::move(to).take().joined();
}

void throwError(Bytes body, const ReadLimits& limits) {
  Reader from(body, limits);
  switch (ErrorKind{from.byte()}) {
    case ErrorKind::decoding:
      throwRead(from, readDecodingError);
    case ErrorKind::breach:
      throwRead(from, readBreach);
    case ErrorKind::unpacking:
      throwRead(from, readUnpackingError);
  }
  throw MalformedReply();
}

}  // namespace Keelgate::Transport
