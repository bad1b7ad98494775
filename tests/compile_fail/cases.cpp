// SPDX-License-Identifier: Apache-2.0
// Compiles as it stands. The mistakes in it that must not, and what each must be told, are in
// run.py.
#include "program/schema/property_list_decoder.h"
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

static_assert(knownKeys<Schema>.find(PropertyList::keyDigest("1"), [] { return "1"; }) == 0);

Record decode(Bytes from) {
  return PropertyListDecoder().decode<Schema, Record>(from);
}

}  // namespace VespKeelgateService
