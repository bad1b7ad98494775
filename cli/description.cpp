// SPDX-License-Identifier: Apache-2.0
/// The walk is at compile time, over types; what it leaves behind is plain data.
#include "cli/description.h"

#include "cli/request_line.h"
#include "framework/json/values.h"
#include "program/service/tables.h"

#include <keelgate/describe.h>
#include <keelgate/type_name.h>

#include <algorithm>
#include <concepts>
#include <type_traits>
#include <variant>

namespace Keelgate::CLI {

namespace {

/// Enters what it is shown, and what that refers to, each once and in the order of meeting.
class Walk {
 public:
  explicit Walk(Description& to) : to_(to) {}

  template <Schema T>
  void enter() {
    enterStruct<T>(to_.schemas);
  }
  template <Record T>
  void enter() {
    enterStruct<T>(to_.records);
  }

 private:
  template <class T>
  void enterStruct(Array<StructTable>& section) {
    if (std::ranges::count(section, typeName<T>(), &StructTable::name) > 0) return;
    // Before its fields: a payload holds payloads.
    const std::size_t position = section.size();
    section.push_back({.name = typeName<T>(), .fields = {}, .kind = kindOf<T>()});
    Array<FieldRow> fields = fieldsOf<T>(section);
    if (&section == &to_.records) {
      for (FieldRow& field : fields) field.key.reset();
    }
    section[position].fields = std::move(fields);
  }

  template <class T>
  static constexpr StructTable::Kind kindOf() {
    if (CaseKeyed<T>) return StructTable::Kind::oneOfItsFields;
    return JSON::isItsField<T> ? StructTable::Kind::itsField : StructTable::Kind::itsFields;
  }

  template <class T>
  Array<FieldRow> fieldsOf(Array<StructTable>& section) {
    Array<FieldRow> rows;
    if constexpr (CaseKeyed<T>) {
      enterCases(rows, section, static_cast<const typename T::variant*>(nullptr), T::caseNames);
    } else {
      FieldsOf<T>::each([&]<class S, class V>(Field<S, V> field) {
        rows.push_back({.name = field.name,
                        .key = field.key,
                        .type = typeText<V>(section),
                        .required = !isOptional<V>});
      });
    }
    return rows;
  }

  template <class... Cases, class Names>
  void enterCases(Array<FieldRow>& rows, Array<StructTable>& section, const std::variant<Cases...>*,
                  const Names& names) {
    std::size_t i = 0;
    ((rows.push_back(
          {.name = names[i], .key = names[i], .type = typeText<Cases>(section), .required = false}),
      ++i),
     ...);
  }

  /// What a value's type is called in a table. `section` takes a case-keyed enumeration, which is
  /// neither schema nor record itself.
  template <class V>
  String typeText(Array<StructTable>& section) {
    if constexpr (isOptional<V>) {
      return typeText<typename V::value_type>(section);
    } else if constexpr (isArray<V>) {
      return "[" + typeText<typename V::value_type>(section) + "]";
    } else if constexpr (std::same_as<V, PropertyListValue>) {
      return "propertyList";
    } else if constexpr (Enumeration<V>) {
      enterEnumeration<V>();
      return String(typeName<V>());
    } else if constexpr (Described<V> || CaseKeyed<V>) {
      enterStruct<V>(section);
      return String(typeName<V>());
    } else {
      return scalarText(std::type_identity<V>());
    }
  }

  // A type that is none of these does not compile: it needs a name before it can travel.
  static const char* scalarText(std::type_identity<String>) { return "string"; }
  static const char* scalarText(std::type_identity<Int>) { return "int"; }
  static const char* scalarText(std::type_identity<UInt>) { return "uint"; }
  static const char* scalarText(std::type_identity<Int64>) { return "int64"; }
  static const char* scalarText(std::type_identity<UInt64>) { return "uint64"; }
  static const char* scalarText(std::type_identity<Double>) { return "double"; }
  static const char* scalarText(std::type_identity<Bool>) { return "bool"; }
  static const char* scalarText(std::type_identity<Data>) { return "data"; }
  static const char* scalarText(std::type_identity<Date>) { return "date"; }
  static const char* scalarText(std::type_identity<UUID>) { return "uuid"; }

  template <class E>
  void enterEnumeration() {
    if (std::ranges::count(to_.enumerations, typeName<E>(), &EnumerationTable::name) > 0) return;
    EnumerationTable table{
        .name = typeName<E>(), .cases = {casesOf<E>.begin(), casesOf<E>.end()}, .fallback = {}};
    // Without one, another number fails the message; a reader of the table has to see which it is.
    if constexpr (Defaulting<E>) table.fallback = nameOf(keelgateDefault(E{}));
    to_.enumerations.push_back(std::move(table));
  }

  Description& to_;
};

/// The name of the case that carries R in a client message's result. Every row's record is a case,
/// since a row takes no other.
template <class R, class... Cases>
std::string_view caseNameOf(const std::variant<Cases...>*) {
  constexpr bool is[] = {std::same_as<R, Cases>...};
  const auto position = std::ranges::find(is, true) - std::begin(is);
  return VespClientMessageType::caseNames[static_cast<std::size_t>(position)];
}

/// The command table of U. Its schemas are entered on the way; its records are reached from the
/// result that carries them.
template <class U>
Array<CommandRow> commandsOf(Walk& walk) {
  Array<CommandRow> rows;
  U::Commands::each([&]<class Row>(std::type_identity<Row>) {
    CommandRow row{.command = Row::command,
                   .schema = {},
                   .caseName = caseNameOf<typename Row::Record>(
                       static_cast<const VespClientMessageType::variant*>(nullptr))};
    if constexpr (Schema<typename Row::Schema>) {
      row.schema = typeName<typename Row::Schema>();
      walk.enter<typename Row::Schema>();
    }
    rows.push_back(row);
  });
  return rows;
}

/// All commands together.
constexpr std::string_view commandsName = typeName<CommandType>();

/// Calls `visitor(rows, label...)` for each section, with the members of a row that are names of
/// it.
template <class D, class Visitor>
void eachSection(D& description, Visitor visitor) {
  visitor(description.messageUnpackers, &MessageUnpackerRow::record, &MessageUnpackerRow::unpacker);
  visitor(description.services, &ServiceRow::service, &ServiceRow::unpacker);
  visitor(description.commands, &EnumerationCase::name);
  visitor(description.schemas, &StructTable::name);
  visitor(description.records, &StructTable::name);
  visitor(description.enumerations, &EnumerationTable::name);
}

/// Who answers it, and how. Empty where the framework does not know it.
Description describeCommand(const Description& all, UInt64 number) {
  Description chosen;
  for (const EnumerationCase& command : all.commands) {
    if (command.rawValue == number) chosen.commands.push_back(command);
  }
  if (chosen.commands.empty()) return chosen;
  for (ServiceRow service : all.services) {
    std::erase_if(service.commands,
                  [&](const CommandRow& row) { return row.command.value_or(number) != number; });
    if (!service.commands.empty()) chosen.services.push_back(std::move(service));
  }
  return chosen;
}

}  // namespace

Description describeAll() {
  Description all;
  Walk walk(all);
  VespKeelgateService::MessageUnpackers::each([&]<class U>(std::type_identity<U>) {
    MessageUnpackerRow row{
        .record = typeName<typename U::SchemaType>(), .unpacker = typeName<U>(), .schema = {}};
    if constexpr (Schema<typename U::Schema>) {
      row.schema = typeName<typename U::Schema>();
      walk.enter<typename U::Schema>();
    }
    all.messageUnpackers.push_back(row);
  });
  VespKeelgateService::Services::each([&]<class S>(std::type_identity<S>) {
    all.services.push_back({.service = S::identifier,
                            .unpacker = typeName<typename S::Unpacker>(),
                            .commands = commandsOf<typename S::Unpacker>(walk)});
  });
  all.commands.assign(casesOf<CommandType::Case>.begin(), casesOf<CommandType::Case>.end());
  OutputRecords::each([&]<class R>(std::type_identity<R>) { walk.enter<R>(); });
  return all;
}

Description describeNamed(const Description& all, std::string_view name) {
  if (const Optional<UInt64> number = decimal(name)) return describeCommand(all, *number);
  Description chosen = all;
  eachSection(chosen, [&](auto& rows, auto... labels) {
    std::erase_if(rows, [&](const auto& row) { return (... && (row.*labels != name)); });
  });
  if (name == commandsName) chosen.commands = all.commands;
  return chosen;
}

Array<std::string_view> namesOf(const Description& all) {
  Array<std::string_view> names;
  eachSection(all, [&](const auto& rows, auto... labels) {
    for (const auto& row : rows) (names.push_back(row.*labels), ...);
  });
  if (all.commands.size() > 1) names.push_back(commandsName);
  std::ranges::sort(names);
  // The record of a message unpacker stands among the records too, and services share unpackers.
  names.erase(std::unique(names.begin(), names.end()), names.end());
  return names;
}

}  // namespace Keelgate::CLI
