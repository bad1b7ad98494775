// SPDX-License-Identifier: Apache-2.0
/// What this build knows, as plain data: walked from the very tables that the service decodes with,
/// so that a new kind of message shows up by itself. Nothing here decodes.
///
/// The names are those of the types in the source. Texts point into constants of the program and
/// stay valid; what is owned is copied. Callable from any thread; throws nothing but
/// std::bad_alloc.
#pragma once

#include <keelgate/enumeration.h>
#include <keelgate/values.h>

#include <string_view>

namespace Keelgate::CLI {

/// An unpacker that is chosen by the record that is asked for.
struct MessageUnpackerRow {
  std::string_view record;
  std::string_view unpacker;
  /// Absent: any message that is well-formed.
  Optional<std::string_view> schema;
};

/// A command that a service answers.
struct CommandRow {
  /// Absent: any command that the framework knows.
  Optional<UInt64> command;
  /// Absent: the message is answered without being decoded.
  Optional<std::string_view> schema;
  /// Under which name the result carries its record.
  std::string_view caseName;
};

/// An unpacker that is chosen by the service that a client message arrived under.
struct ServiceRow {
  /// As it is compared: exactly.
  std::string_view service;
  std::string_view unpacker;
  Array<CommandRow> commands;
};

/// A field of a schema or a record, or a case of a case-keyed enumeration, which is not required.
struct FieldRow {
  std::string_view name;
  /// On the wire; absent of a record's field, which does not travel.
  Optional<std::string_view> key;
  /// "string", "uint64", a schema's name, "[data]" and so on.
  String type;
  Bool required;
};

/// A schema or a record with its fields in their order.
struct StructTable {
  /// How its value is printed: as an object of the fields that are there, of exactly one of them,
  /// or as its only field.
  enum class Kind : std::uint8_t { itsFields, oneOfItsFields, itsField };

  std::string_view name;
  Array<FieldRow> fields;
  Kind kind;
};

/// An enumeration whose cases travel as numbers.
struct EnumerationTable {
  std::string_view name;
  Array<EnumerationCase> cases;
  /// The case that any other number stands for; absent where others are refused.
  Optional<std::string_view> fallback;
};

struct Description {
  Array<MessageUnpackerRow> messageUnpackers;
  Array<ServiceRow> services;
  /// Every command that the framework knows.
  Array<EnumerationCase> commands;
  Array<StructTable> schemas;
  Array<StructTable> records;
  Array<EnumerationTable> enumerations;
};

/// Everything, in the order in which a walk from the tables first meets it.
Description describeAll();

/// What is called `name`: a record type, unpacker, service, command, schema, record or enumeration.
/// One name can stand for several of them. Empty when there is none.
Description describeNamed(const Description& all, std::string_view name);

/// All names, sorted and each once.
Array<std::string_view> namesOf(const Description& description);

}  // namespace Keelgate::CLI
