// SPDX-License-Identifier: Apache-2.0
/// The sentences say what was expected and what type was there, never which value: they go into
/// logs that others read.
#include "program/schema/decoding_errors.h"

namespace VespKeelgateService::Errors {

using Keelgate::String;
using Kind = DecodingError::Kind;

namespace {

std::string_view nameOf(PropertyList::Type type) {
  using PropertyList::Type;
  switch (type) {
    case Type::null:
      return "a null";
    case Type::boolean:
      return "a boolean";
    case Type::integer:
      return "an integer";
    case Type::real:
      return "a real";
    case Type::date:
      return "a date";
    case Type::string:
      return "a string";
    case Type::data:
      return "data";
    case Type::array:
      return "an array";
    case Type::dictionary:
      return "a dictionary";
    case Type::uid:
      return "a UID";
    case Type::set:
      return "a set";
  }
  // A type that is none, which only a cast can make.
  return "something else";
}

DecodingError corrupted(const CodingPath& path, String description) {
  return {Kind::dataCorrupted, std::nullopt, path.steps(), std::move(description)};
}

}  // namespace

DecodingError keyNotFound(const CodingPath& path, std::string_view key) {
  return {Kind::keyNotFound, String(key), path.steps(),
          "No value associated with key \"" + String(key) + "\"."};
}

DecodingError typeMismatch(const CodingPath& path, std::string_view expected,
                           PropertyList::Type found) {
  return {Kind::typeMismatch, std::nullopt, path.steps(),
          "Expected to decode " + String(expected) + " but found " + String(nameOf(found)) +
              " instead."};
}

DecodingError notOneKey(const CodingPath& path) {
  return {Kind::typeMismatch, std::nullopt, path.steps(),
          "Invalid number of keys found, expected one."};
}

DecodingError valueNotFound(const CodingPath& path, std::string_view expected) {
  return {Kind::valueNotFound, std::nullopt, path.steps(),
          "Expected " + String(expected) + " but found null instead."};
}

DecodingError numberDoesNotFit(const CodingPath& path, std::string_view expected) {
  return corrupted(path, "The number does not fit in " + String(expected) + ".");
}

DecodingError invalidRawValue(const CodingPath& path, std::string_view enumeration) {
  return corrupted(path, "The number is not a raw value of " + String(enumeration) + ".");
}

DecodingError invalidUUID(const CodingPath& path) {
  return corrupted(path, "The string is not a UUID.");
}

// Without a path: what is malformed, or too much, is the message as a whole.
DecodingError malformed(const PropertyList::MalformedDocument& error, Keelgate::Bytes message) {
  return {Kind::dataCorrupted, std::nullopt, {}, PropertyList::describe(error, message)};
}

}  // namespace VespKeelgateService::Errors
