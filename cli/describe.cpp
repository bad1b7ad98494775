// SPDX-License-Identifier: Apache-2.0
/// One description, printed twice: as JSON for programs and as tables for people. Neither knows a
/// record by name.
#include "cli/commands.h"
#include "cli/description.h"
#include "cli/json_schema.h"
#include "cli/nearest.h"
#include "cli/table.h"
#include "framework/json/values.h"

#include <fmt/format.h>

namespace Keelgate::CLI {

namespace {

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

void writeServices(Writer& out, const Description& what) {
  writeRows(out, "services", what.services, [&](const ServiceRow& service) {
    writeField(out, "service", service.service);
    writeField(out, "unpacker", service.unpacker);
    writeRows(out, "commands", service.commands, [&](const CommandRow& row) {
      writeField(out, "command", row.command);
      writeField(out, "schema", row.schema);
      writeField(out, "case", row.caseName);
    });
  });
}

/// Schemas say what a message must have, records what they may lack: one table, two ways to ask.
void writeTables(Writer& out, std::string_view key, const Array<StructTable>& tables,
                 Bool schemas) {
  out.key(key);
  out.beginObject();
  for (const StructTable& table : tables) {
    writeRows(out, table.name, table.fields, [&](const FieldRow& field) {
      writeField(out, "field", field.name);
      if (schemas) writeField(out, "key", field.key);
      writeField(out, "type", field.type);
      writeField(out, schemas ? "required" : "optional", field.required == schemas);
    });
  }
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
  writeRows(out, "messageUnpackers", what.messageUnpackers, [&](const MessageUnpackerRow& row) {
    writeField(out, "record", row.record);
    writeField(out, "unpacker", row.unpacker);
    writeField(out, "schema", row.schema);
  });
  writeServices(out, what);
  writeRows(out, "commands", what.commands, [&](const EnumerationCase& command) {
    writeField(out, "rawValue", command.rawValue);
    writeField(out, "name", command.name);
  });
  writeTables(out, "schemas", what.schemas, true);
  writeTables(out, "records", what.records, false);
  writeEnumerations(out, what);
  out.endObject();
}

// ----------------------------------------------------------------------------------- tables

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

  /// A table with a row for each element.
  template <class Rows, class Cells>
  void table(Array<String> headings, const Rows& rows, const Cells& cells) {
    Table table(std::move(headings));
    for (const auto& row : rows) table.add(cells(row));
    text_ += table.text(width_, colour_);
  }

 private:
  String text_;
  // Asked once, so that a page is of one kind.
  std::size_t width_ = outputWidth();
  Bool colour_ = outputHasColour();
};

void addUnpackers(Page& page, const Description& what) {
  // Of a single name most tables are empty, and headings without rows would say nothing.
  if (what.messageUnpackers.empty()) return;
  page.heading("Record types");
  page.table(
      {"RECORD", "UNPACKER", "SCHEMA"}, what.messageUnpackers,
      [](const MessageUnpackerRow& row) -> Array<String> {
        return {String(row.record), String(row.unpacker), String(row.schema.value_or("(any)"))};
      });
}

void addServices(Page& page, const Description& what) {
  for (const ServiceRow& service : what.services) {
    page.heading(fmt::format("Service {}, by {}", service.service, service.unpacker));
    page.table({"COMMAND", "SCHEMA", "CASE"}, service.commands,
               [](const CommandRow& row) -> Array<String> {
                 return {row.command ? fmt::format("{}", *row.command) : "any known",
                         String(row.schema.value_or("(not decoded)")), String(row.caseName)};
               });
  }
}

void addCommands(Page& page, const Description& what) {
  if (what.commands.empty()) return;
  page.heading("Commands");
  page.table({"NUMBER", "NAME"}, what.commands, [](const EnumerationCase& row) -> Array<String> {
    return {fmt::format("{}", row.rawValue), String(row.name)};
  });
}

/// In the overview: sixty tables of fields would bury the rest.
void addNames(Page& page, const String& title, const Array<StructTable>& tables) {
  page.heading(title);
  page.table({"NAME", "FIELDS"}, tables, [](const StructTable& table) -> Array<String> {
    return {String(table.name), fmt::format("{}", table.fields.size())};
  });
}

void addFields(Page& page, const Description& what) {
  for (const StructTable& table : what.schemas) {
    page.heading(fmt::format("Schema {}", table.name));
    page.table({"FIELD", "KEY", "TYPE", ""}, table.fields,
               [](const FieldRow& field) -> Array<String> {
                 return {String(field.name), String(field.key), field.type,
                         field.required ? "required" : ""};
               });
  }
  for (const StructTable& table : what.records) {
    page.heading(fmt::format("Record {}", table.name));
    page.table({"FIELD", "TYPE", ""}, table.fields, [](const FieldRow& field) -> Array<String> {
      return {String(field.name), field.type, field.required ? "" : "optional"};
    });
  }
}

/// "unknown = 0, timer = 1; any other number: unknown"
String casesText(const EnumerationTable& table) {
  String text;
  for (const EnumerationCase& entry : table.cases) {
    text += fmt::format("{}{} = {}", text.empty() ? "" : ", ", entry.name, entry.rawValue);
  }
  if (table.fallback) text += fmt::format("; any other number: {}", *table.fallback);
  return text;
}

void addEnumerations(Page& page, const Description& what) {
  if (what.enumerations.empty()) return;
  page.heading("Enumerations");
  page.table({"NAME", "CASES"}, what.enumerations,
             [](const EnumerationTable& table) -> Array<String> {
               return {String(table.name), casesText(table)};
             });
}

String pageText(const Description& what, Bool overview) {
  Page page;
  addUnpackers(page, what);
  addServices(page, what);
  addCommands(page, what);
  if (overview) {
    addNames(page, "Schemas", what.schemas);
    addNames(page, "Records", what.records);
  } else {
    addFields(page, what);
  }
  addEnumerations(page, what);
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
  if (isEmpty(what)) {
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
  } else if (!name) {
    writeReplySchema(out, all);
  } else if (!writeJsonSchema(out, all, *name)) {
    console.complain(fmt::format("\"{}\" is not a record: it has no JSON", *name));
    console.note(Status::unusable);
    return;
  }
  for (const String& piece : std::move(out).take()) console.print(piece);
}

}  // namespace Keelgate::CLI
