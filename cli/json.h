// SPDX-License-Identifier: Apache-2.0
/// Records as JSON, walked from their one description: a new record needs no line here.
///
/// The output is a RapidJSON Writer or PrettyWriter. A record is an object with the fields under
/// their labels, in their order; an absent value is left out; an enumeration whose case carries a
/// record is an object with that one key.
///
///     const String line = jsonObject(Layout::compact, [&](auto& out) {
///       writeField(out, "record", String("VespSampleMessage"));
///       writeField(out, "value", message);
///     });
///
/// Nothing here looks at more than its arguments: callable from any thread. Nothing throws but
/// std::bad_alloc. Text and numbers are formatted by json_text.h and handed over as raw JSON; the
/// writer keeps the commas and the indentation.
#pragma once

#include "cli/json_text.h"

#include <keelgate/describe.h>
#include <keelgate/records.h>

#include <rapidjson/prettywriter.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include <concepts>
#include <string_view>
#include <utility>
#include <variant>

namespace Keelgate::CLI {

/// How an object is laid out: indented for people, or on one line for programs.
enum class Layout { pretty, compact };

/// A member's key. Keys are names from tables and need no escaping beyond the writer's own.
template <class Out>
void writeKey(Out& out, std::string_view key) {
  out.Key(key.data(), static_cast<rapidjson::SizeType>(key.size()));
}

/// A string of unknown origin.
template <class Out>
void writeString(Out& out, std::string_view text) {
  const String json = jsonString(text);
  out.RawValue(json.data(), json.size(), rapidjson::kStringType);
}

/// A value whose JSON text is ready. The writer does not look at the text; the type that it is told
/// matters for keys alone.
template <class Out>
void writeRaw(Out& out, std::string_view json) {
  out.RawValue(json.data(), json.size(), rapidjson::kNumberType);
}

/// Any value that a record can hold, records included.
template <class Out, class T>
void writeJson(Out& out, const T& value);

template <class Out, class T>
requires(isArray<Array<T>>) void writeJson(Out& out, const Array<T>& values) {
  out.StartArray();
  for (const T& value : values) writeJson(out, value);
  out.EndArray();
}

/// A member with its value; none where the value is absent.
template <class Out, class T>
void writeField(Out& out, std::string_view name, const T& value) {
  writeKey(out, name);
  writeJson(out, value);
}

template <class Out, class T>
void writeField(Out& out, std::string_view name, const Optional<T>& value) {
  if (value) writeField(out, name, *value);
}

template <class Out, class T>
void writeJson(Out& out, const T& value) {
  if constexpr (std::same_as<T, Bool>) {
    out.Bool(value);
  } else if constexpr (std::signed_integral<T>) {
    out.Int64(value);
  } else if constexpr (std::unsigned_integral<T>) {
    out.Uint64(value);
  } else if constexpr (Enumeration<T>) {
    writeString(out, nameOf(value));
  } else if constexpr (std::same_as<T, Double>) {
    writeRaw(out, numberText(value));
  } else if constexpr (std::same_as<T, Date>) {
    writeRaw(out, dateText(value));
  } else if constexpr (std::same_as<T, UUID>) {
    writeRaw(out, uuidText(value));
  } else if constexpr (std::same_as<T, String>) {
    writeString(out, value);
  } else if constexpr (std::same_as<T, Data>) {
    writeRaw(out, base64Text(value));
  } else if constexpr (std::same_as<T, VespClientMessageResult>) {
    // The one record that is not an object of its fields: it is its case.
    writeJson(out, value.result);
  } else {
    out.StartObject();
    if constexpr (CaseKeyed<T>) {
      std::visit(
          [&](const auto& payload) { writeField(out, T::caseNames[value.index()], payload); },
          value);
    } else {
      FieldsOf<T>::each([&](auto field) { writeField(out, field.name, value.*field.member); });
    }
    out.EndObject();
  }
}

/// One object and a newline; `members(out)` writes what is in it. Whole in memory before any of it
/// is printed: half an object on standard output could not be taken back.
template <class Members>
String jsonObject(Layout layout, const Members& members) {
  rapidjson::StringBuffer buffer;
  const auto write = [&](auto&& out) {
    out.StartObject();
    members(out);
    out.EndObject();
  };
  if (layout == Layout::pretty) {
    rapidjson::PrettyWriter out(buffer);
    out.SetIndent(' ', 2);
    write(out);
  } else {
    write(rapidjson::Writer(buffer));
  }
  return String(buffer.GetString(), buffer.GetSize()) + '\n';
}

}  // namespace Keelgate::CLI
