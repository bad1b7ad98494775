// SPDX-License-Identifier: Apache-2.0
/// What no template writes. Trees by recursion: one is at most 512 containers deep, and a step of
/// it takes little stack.
#include "framework/json/values.h"

#include "text/date_time.h"
#include "text/uuid.h"

#include <array>
#include <charconv>
#include <cstddef>

namespace Keelgate::JSON {

namespace {

/// In hexadecimal where 64 bits do not hold it: few readers of JSON know longer integers.
void writeNumber(Writer& out, const PropertyListUID& uid) {
  if (uid.high == 0) return out.integer(uid.low);
  std::array<char, 40> text;
  char* end = std::to_chars(text.data(), text.data() + text.size(), uid.high, 16).ptr;
  for (int shift = 60; shift >= 0; shift -= 4) *end++ = "0123456789abcdef"[uid.low >> shift & 15];
  out.string("0x" + String(text.data(), end));
}

/// Writes a value below its type in the typed form, in place of it in the plain one.
struct Tree {
  Writer& out;
  Bool typed;

  void operator()(std::nullptr_t) const { out.raw("null"); }
  void operator()(const Array<PropertyListValue>& elements) const {
    out.beginArray();
    for (const PropertyListValue& element : elements) inner(element);
    out.endArray();
  }
  void operator()(const PropertyListSet& set) const { (*this)(set.elements); }
  void operator()(const Array<PropertyListEntry>& entries) const {
    out.beginObject();
    for (const PropertyListEntry& entry : entries) {
      out.key(entry.key);
      inner(entry.value);
    }
    out.endObject();
  }
  void operator()(Date date) const {
    // Text has microseconds, and no room for what is outside the calendar.
    typed ? out.number(date.secondsSinceReferenceDate) : write(out, date);
  }
  void operator()(const PropertyListUID& uid) const {
    if (typed) return writeNumber(out, uid);
    out.beginObject();
    out.key("uid");
    writeNumber(out, uid);
    out.endObject();
  }
  template <class T>
  void operator()(const T& scalar) const {
    write(out, scalar);
  }

 private:
  void inner(const PropertyListValue& value) const {
    typed ? writeTyped(out, value) : write(out, value);
  }
};

}  // namespace

void write(Writer& out, Date date) {
  if (const auto text = Text::dateTimeText(date.secondsSinceReferenceDate)) {
    out.string(*text);
  } else {
    out.number(date.secondsSinceReferenceDate);
  }
}

void write(Writer& out, const UUID& uuid) {
  out.string(Text::uuidText(uuid.octets));
}

void write(Writer& out, const PropertyListValue& value) {
  std::visit(Tree{out, false}, value);
}

void writeTyped(Writer& out, const PropertyListValue& value) {
  out.beginObject();
  writeField(out, "type", PropertyListValue::caseNames[value.index()]);
  out.key("value");
  std::visit(Tree{out, true}, value);
  out.endObject();
}

}  // namespace Keelgate::JSON
