// SPDX-License-Identifier: Apache-2.0
/// One description, printed twice: as JSON for programs and as tables for people, by the same
/// columns. Neither knows a record by name.
#include "cli/commands.h"
#include "cli/description.h"
#include "cli/json_schema.h"
#include "cli/nearest.h"
#include "cli/table.h"
#include "framework/json/values.h"

#include <fmt/format.h>

#include <concepts>

namespace Keelgate::CLI {

namespace {

// ---------------------------------------------------------------------------------- columns

// A row shows its columns one after the other: the heading, the key in JSON, the value, and what
// people read where there is none.

void eachColumn(const MessageUnpackerRow& row, const auto& show) {
  show("RECORD", "record", row.record);
  show("UNPACKER", "unpacker", row.unpacker);
  show("SCHEMA", "schema", row.schema, "(any)");
}

void eachColumn(const CommandRow& row, const auto& show) {
  show("COMMAND", "command", row.command, "any known");
  show("SCHEMA", "schema", row.schema, "(not decoded)");
  show("CASE", "case", row.caseName);
}

void eachColumn(const EnumerationCase& row, const auto& show) {
  show("NUMBER", "rawValue", row.rawValue);
  show("NAME", "name", row.name);
}

/// Schemas say what a message must have, records what they may lack.
void eachColumn(const FieldRow& row, const auto& show) {
  show("FIELD", "field", row.name);
  if (row.key) show("KEY", "key", *row.key);
  show("TYPE", "type", row.type);
  show("", row.key ? "required" : "optional", row.required == row.key.has_value());
}

/// In the overview: sixty tables of fields would bury the rest.
void eachColumn(const StructTable& table, const auto& show) {
  show("NAME", "", table.name);
  show("FIELDS", "", table.fields.size());
}

/// As in "unknown = 0, timer = 1; any other number: unknown".
void eachColumn(const EnumerationTable& table, const auto& show) {
  String cases;
  for (const EnumerationCase& entry : table.cases) {
    cases += fmt::format("{}{} = {}", cases.empty() ? "" : ", ", entry.name, entry.rawValue);
  }
  if (table.fallback) cases += fmt::format("; any other number: {}", *table.fallback);
  show("NAME", "", table.name);
  show("CASES", "", cases);
}

// ------------------------------------------------------------------------------------- JSON

using JSON::writeField;
using JSON::Writer;

/// A member that is an array with an object for each row.
template <class Rows, class WriteMembers>
void writeRows(Writer& out, std::string_view key, const Rows& rows, WriteMembers writeMembers) {
  out.key(key);
  out.beginArray();
  for (const auto& row : rows) {
    out.beginObject();
    writeMembers(row);
    out.endObject();
  }
  out.endArray();
}

template <class Row>
void writeColumns(Writer& out, std::string_view key, const Array<Row>& rows) {
  writeRows(out, key, rows, [&](const Row& row) {
    eachColumn(row, [&](std::string_view, std::string_view member, const auto& value,
                        std::string_view = {}) { writeField(out, member, value); });
  });
}

void writeTables(Writer& out, std::string_view key, const Array<StructTable>& tables) {
  out.key(key);
  out.beginObject();
  for (const StructTable& table : tables) writeColumns(out, table.name, table.fields);
  out.endObject();
}

void writeEnumerations(Writer& out, const Description& what) {
  out.key("enumerations");
  out.beginObject();
  for (const EnumerationTable& table : what.enumerations) {
    out.key(table.name);
    out.beginObject();
    writeRows(out, "cases", table.cases, [&](const EnumerationCase& entry) {
      writeField(out, "name", entry.name);
      writeField(out, "rawValue", entry.rawValue);
    });
    writeField(out, "default", table.fallback);
    out.endObject();
  }
  out.endObject();
}

void writeDescription(Writer& out, const Description& what) {
  out.beginObject();
  writeColumns(out, "messageUnpackers", what.messageUnpackers);
  writeRows(out, "services", what.services, [&](const ServiceRow& service) {
    writeField(out, "service", service.service);
    writeField(out, "unpacker", service.unpacker);
    writeColumns(out, "commands", service.commands);
  });
  writeColumns(out, "commands", what.commands);
  writeTables(out, "schemas", what.schemas);
  writeTables(out, "records", what.records);
  writeEnumerations(out, what);
  out.endObject();
}

// ----------------------------------------------------------------------------------- tables

template <class V>
String cell(std::string_view key, const V& value, std::string_view absent) {
  if constexpr (isOptional<V>) {
    return value ? cell(key, *value, absent) : String(absent);
  } else if constexpr (std::same_as<V, Bool>) {
    return value ? String(key) : String();
  } else {
    return fmt::format("{}", value);
  }
}

/// Lays a description out for people.
class Page {
 public:
  [[nodiscard]] String take() && { return std::move(text_); }

  void heading(const String& title) {
    if (!text_.empty()) text_ += '\n';
    for (const String& line : paragraph({title}, 0, width_)) {
      text_ += emphasised(line, colour_) + '\n';
    }
  }

  /// A table with a row for each element. Of a single name most are empty, and a heading without
  /// rows would say nothing.
  template <class Row>
  void table(const String& title, const Array<Row>& rows) {
    if (rows.empty()) return;
    heading(title);
    Table table(cells(rows.front(), true));
    for (const Row& row : rows) table.add(cells(row, false));
    text_ += table.text(width_, colour_);
  }

 private:
  static Array<String> cells(const auto& row, Bool ofHeadings) {
    Array<String> all;
    eachColumn(row, [&](std::string_view heading, std::string_view key, const auto& value,
                        std::string_view absent = {}) {
      all.push_back(ofHeadings ? String(heading) : cell(key, value, absent));
    });
    return all;
  }

  String text_;
  // Asked once, so that a page is of one kind.
  std::size_t width_ = outputWidth();
  Bool colour_ = outputHasColour();
};

String pageText(const Description& what, Bool overview) {
  Page page;
  page.table("Record types", what.messageUnpackers);
  for (const ServiceRow& service : what.services) {
    page.table(fmt::format("Service {}, by {}", service.service, service.unpacker),
               service.commands);
  }
  page.table("Commands", what.commands);
  if (overview) {
    page.table("Schemas", what.schemas);
    page.table("Records", what.records);
  } else {
    for (const auto& table : what.schemas) page.table("Schema " + String(table.name), table.fields);
    for (const auto& table : what.records) page.table("Record " + String(table.name), table.fields);
  }
  page.table("Enumerations", what.enumerations);
  // An overview is the only page that does not show all there is.
  if (overview) page.heading("`keelgate describe NAME` shows the fields of one.");
  return std::move(page).take();
}

}  // namespace

void describe(const Optional<String>& name, DescribeForm form, Console& console) {
  const Description all = describeAll();
  // Everything is described and then cut down: one walk, whatever is asked.
  const Description what = name ? describeNamed(all, *name) : all;
  Writer out(JSON::Layout::pretty);
  if (namesOf(what).empty()) {
    console.complain(
        fmt::format("nothing is called \"{}\"; {}", *name,
                    suggestion(namesOf(all), *name, "`keelgate describe` lists all names")));
    console.note(Status::unusable);
    return;
  }
  if (form == DescribeForm::page) {
    console.print(pageText(what, !name));
    return;
  }
  if (form == DescribeForm::json) {
    writeDescription(out, what);
  } else if (!writeJsonSchema(out, all, name)) {
    console.complain(fmt::format("\"{}\" is not a record: it has no JSON", *name));
    console.note(Status::unusable);
    return;
  }
  for (const String& piece : std::move(out).take()) console.print(piece);
}

}  // namespace Keelgate::CLI
