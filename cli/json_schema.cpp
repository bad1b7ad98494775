// SPDX-License-Identifier: Apache-2.0
#include "cli/json_schema.h"

#include "framework/json/reply.h"
#include "framework/json/values.h"

#include <keelgate/errors.h>
#include <keelgate/type_name.h>

#include <algorithm>
#include <iterator>
#include <span>

namespace Keelgate::CLI {

namespace {

using JSON::writeField;
using JSON::Writer;
using VespKeelgateService::VespClientMessageUnpackingError;

struct Scalar {
  std::string_view name;
  std::string_view schema;
};

/// Whatever is neither a record nor an enumeration, as values.cpp writes it.
constexpr Scalar scalars[] = {
    {"string", R"({"type":"string"})"},
    {"bool", R"({"type":"boolean"})"},
    {"int", R"({"type":"integer","minimum":-9223372036854775808,"maximum":9223372036854775807})"},
    {"int64", R"({"type":"integer","minimum":-9223372036854775808,"maximum":9223372036854775807})"},
    {"uint", R"({"type":"integer","minimum":0,"maximum":18446744073709551615})"},
    {"uint64", R"({"type":"integer","minimum":0,"maximum":18446744073709551615})"},
    {"double", R"({"anyOf":[{"type":"number"},{"enum":["nan","inf","-inf"]}]})"},
    {"data",
     R"({"type":"string","contentEncoding":"base64","pattern":"^([A-Za-z0-9+/]{4})*([A-Za-z0-9+/]{2}==|[A-Za-z0-9+/]{3}=)?$"})"},
    {"date",
     R"({"anyOf":[{"type":"string","format":"date-time","pattern":"^[0-9]{4}-[0-9]{2}-[0-9]{2}T[0-9]{2}:[0-9]{2}:[0-9]{2}([.][0-9]{1,6})?Z$"},{"type":"number"}]})"},
    {"uuid",
     R"({"type":"string","format":"uuid","pattern":"^[0-9A-F]{8}(-[0-9A-F]{4}){3}-[0-9A-F]{12}$"})"},
    {"propertyList",
     R"({"anyOf":[{"type":["string","number","boolean","null"]},{"type":"array","items":{"$ref":"#/$defs/propertyList"}},{"type":"object","additionalProperties":{"$ref":"#/$defs/propertyList"}}]})"},
    {"codingPath",
     R"({"type":"array","items":{"anyOf":[{"type":"string"},{"type":"integer","minimum":0}]}})"},
};

/// A member of an object that is printed.
struct Member {
  std::string_view name;
  /// As a field's type; empty for one of `texts`.
  std::string_view type;
  Bool required = true;
  Array<std::string_view> texts = {};
};

Member oneOf(std::string_view name, Array<std::string_view> texts) {
  return {.name = name, .type = {}, .texts = std::move(texts)};
}

/// The members of each kind of error.
Array<Array<Member>> errorShapes() {
  using Kind = DecodingError::Kind;
  Array<std::string_view> others;
  for (const EnumerationCase& kind : casesOf<Kind>) {
    if (kind.rawValue != rawValueOf(Kind::keyNotFound)) others.push_back(kind.name);
  }
  return {
      {oneOf("kind", {nameOf(Kind::keyNotFound)}),
       {"key", "string"},
       {"codingPath", "codingPath"},
       {"description", "string"}},
      {oneOf("kind", others), {"codingPath", "codingPath"}, {"description", "string"}},
      {oneOf("kind", {"breach"}),
       {"domain", "string"},
       {"errorType", "string"},
       {"keyPath", "string", false}},
      {oneOf("kind", {"unpacking"}),
       {"domain", "string"},
       {"code", "int"},
       {"case", "case"},
       {"command", "uint64", false},
       {"service", "string", false}},
      {oneOf("kind", {"host"}), {"reason", "reason"}, {"description", "string"}},
      {oneOf("kind", {"request"}), {"description", "string"}},
  };
}

Array<std::string_view> namesOf(std::span<const EnumerationCase> cases) {
  Array<std::string_view> names;
  for (const EnumerationCase& entry : cases) names.push_back(entry.name);
  return names;
}

class Schema {
 public:
  Schema(Writer& out, const Description& all) : out_(out), all_(all) {
    out_.beginObject();
    writeField(out_, "$schema", "https://json-schema.org/draft/2020-12/schema");
  }

  /// The value of a record or an enumeration.
  void value(std::string_view name) {
    referTo(name);
    end();
  }

  void reply() {
    Array<Array<Member>> shapes;
    for (const std::string_view name : JSON::recordNames()) {
      shapes.push_back({oneOf("record", {name}), {"value", name}});
    }
    constexpr std::string_view result = typeName<VespClientMessageResult>();
    shapes.push_back({oneOf("record", {result}), {"value", result}});
    shapes.push_back({{"error", "error"}});
    anyOf(shapes, true);
    end();
  }

 private:
  /// All that was referred to, and what that refers to, each once.
  void end() {
    out_.key("$defs");
    out_.beginObject();
    // By position: definitions enter further names.
    for (std::size_t i = 0; i < names_.size(); ++i) {
      out_.key(names_[i]);
      define(names_[i]);
    }
    out_.endObject();
    out_.endObject();
  }

  void referTo(std::string_view type) {
    if (type.starts_with('[')) {
      writeField(out_, "type", "array");
      out_.key("items");
      out_.beginObject();
      referTo(type.substr(1, type.size() - 2));
      out_.endObject();
      return;
    }
    writeField(out_, "$ref", "#/$defs/" + String(type));
    if (std::ranges::find(names_, type) == names_.end()) names_.push_back(type);
  }

  void anyOf(const Array<Array<Member>>& shapes, Bool areReplies = false) {
    out_.key("anyOf");
    out_.beginArray();
    for (const Array<Member>& members : shapes) {
      out_.beginObject();
      object(members, areReplies);
      out_.endObject();
    }
    out_.endArray();
  }

  /// An object with these members and no more, but for what a reply may begin with.
  void object(const Array<Member>& members, Bool isReply = false) {
    writeField(out_, "type", "object");
    out_.key("properties");
    out_.beginObject();
    if (isReply) {
      out_.key("id");
      out_.raw("true");
      out_.key("file");
      out_.raw(R"({"type":"string"})");
    }
    Array<std::string_view> required;
    for (const Member& member : members) {
      out_.key(member.name);
      out_.beginObject();
      if (member.type.empty()) {
        writeField(out_, "enum", member.texts);
      } else {
        referTo(member.type);
      }
      out_.endObject();
      if (member.required) required.push_back(member.name);
    }
    out_.endObject();
    writeField(out_, "required", required);
    writeField(out_, "additionalProperties", false);
  }

  void define(std::string_view name) {
    const auto scalar = std::ranges::find(scalars, name, &Scalar::name);
    if (scalar != std::end(scalars)) return out_.raw(scalar->schema);
    out_.beginObject();
    const auto record = std::ranges::find(all_.records, name, &StructTable::name);
    const auto enumeration = std::ranges::find(all_.enumerations, name, &EnumerationTable::name);
    if (record != all_.records.end()) {
      define(*record);
    } else if (enumeration != all_.enumerations.end()) {
      writeField(out_, "enum", namesOf(enumeration->cases));
    } else if (name == "error") {
      anyOf(errorShapes());
    } else if (name == "reason") {
      writeField(out_, "enum", namesOf(casesOf<HostError::Reason>));
    } else {
      writeField(out_, "enum", namesOf(casesOf<VespClientMessageUnpackingError::Case>));
    }
    out_.endObject();
  }

  void define(const StructTable& table) {
    if (table.kind == StructTable::Kind::itsField) return referTo(table.fields.front().type);
    Array<Member> members;
    for (const FieldRow& field : table.fields) {
      members.push_back({field.name, field.type, field.required});
    }
    object(members);
    if (table.kind == StructTable::Kind::oneOfItsFields) {
      writeField(out_, "minProperties", Int{1});
      writeField(out_, "maxProperties", Int{1});
    }
  }

  Writer& out_;
  const Description& all_;
  /// Of the definitions, in the order in which they are first referred to.
  Array<std::string_view> names_;
};

}  // namespace

Bool writeJsonSchema(Writer& out, const Description& all, const Optional<String>& name) {
  if (!name) {
    Schema(out, all).reply();
    return true;
  }
  if (std::ranges::count(all.records, *name, &StructTable::name) == 0 &&
      std::ranges::count(all.enumerations, *name, &EnumerationTable::name) == 0) {
    return false;
  }
  Schema(out, all).value(*name);
  return true;
}

}  // namespace Keelgate::CLI
