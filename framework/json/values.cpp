// SPDX-License-Identifier: Apache-2.0
#include "framework/json/values.h"

#include "text/date_time.h"
#include "text/uuid.h"

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

}  // namespace Keelgate::JSON
