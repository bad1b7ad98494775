// SPDX-License-Identifier: Apache-2.0
// Compiles as it stands. The mistakes in it that must not, and what each must be told, are in
// run.py.
#include "framework/contracts/construct.h"
#include "program/schema/field_by_field.h"
#include "program/schema/key_table.h"
#include "program/schema/values.h"

namespace VespKeelgateService {

struct Inner {
  KEELGATE_SCHEMA(Inner,
      (Int, n));
};

struct InnerRecord {
  KEELGATE_RECORD(InnerRecord,
      (Int, n));
};

struct Schema {
  KEELGATE_SCHEMA(Schema,
      (Int, one, "1"),
      (String, two, "2"),
      (Optional<Inner>, three));
};

struct Record {
  KEELGATE_RECORD(Record,
      (Int, one),
      (String, two),
      (Optional<InnerRecord>, three));
};

static_assert(KeyTable<Schema>::find("1", PropertyList::keyHash("1")) == 0);

Record convert(Schema&& schema) {
  return fieldByField<Record>(std::move(schema), label<&Record::three> = Optional<InnerRecord>());
}

Record byHand(Schema&& schema) {
  return Keelgate::construct<Record>(
      {.one = schema.one, .two = std::move(schema.two), .three = {}});
}

}  // namespace VespKeelgateService
