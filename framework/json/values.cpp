// SPDX-License-Identifier: Apache-2.0
#include "framework/json/values.h"

#include "text/date_time.h"
#include "text/uuid.h"

#include <cstdio>

namespace Keelgate::JSON {

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

void write(Writer& out, const PropertyListUID& uid) {
  out.beginObject();
  if (uid.high == 0) {
    writeField(out, "uid", uid.low);
  } else {
    char text[35];
    std::snprintf(text, sizeof text, "0x%llx%016llx", uid.high, uid.low);
    writeField(out, "uid", String(text));
  }
  out.endObject();
}

void write(Writer& out, const PropertyListValue& value) {
  std::visit(
      [&]<class V>(const V& held) {
        if constexpr (std::same_as<V, std::nullptr_t>) {
          out.raw("null");
        } else if constexpr (std::same_as<V, PropertyListSet>) {
          writeArray(out, held.elements);
        } else if constexpr (std::same_as<V, Array<PropertyListEntry>>) {
          out.beginObject();
          for (const PropertyListEntry& entry : held) writeField(out, entry.key, entry.value);
          out.endObject();
        } else {
          write(out, held);
        }
      },
      value);
}

}  // namespace Keelgate::JSON
