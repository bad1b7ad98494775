// SPDX-License-Identifier: Apache-2.0
// Compiles as it stands. The mistakes in it that must not, and what each must be told, are in
// run.py.
#include "framework/contracts/construct.h"
#include "program/schema/field_by_field.h"
#include "program/schema/key_table.h"
#include "program/schema/values.h"

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

struct Inner {
  FIELD(Int, n);
  CODING_KEYS(Inner);
};

struct InnerRecord {
  FIELD(Int, n);
  LABELS(InnerRecord);
};

struct Schema {
  FIELD(Int, one, "1");
  FIELD(String, two, "2");
  FIELD(Optional<Inner>, three);
  CODING_KEYS(Schema);
};

struct Record {
  FIELD(Int, one);
  FIELD(String, two);
  FIELD(Optional<InnerRecord>, three);
  LABELS(Record);
};

static_assert(KeyTable<Schema>::find("1") == 0);

Record convert(Schema&& schema) {
  return fieldByField<Record>(std::move(schema), label<&Record::three> = Optional<InnerRecord>());
}

Record byHand(Schema&& schema) {
  return Keelgate::construct<Record>(
      {.one = schema.one, .two = std::move(schema.two), .three = {}});
}

}  // namespace VespKeelgateService
