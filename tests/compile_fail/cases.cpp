// SPDX-License-Identifier: Apache-2.0
// Mistakes that must not compile, one for each value of CASE; without CASE it all compiles. The
// message that each must give is in run.py.
#include "framework/contracts/construct.h"
#include "program/schema/field_by_field.h"
#include "program/schema/key_table.h"
#include "program/schema/values.h"

#ifndef CASE
#define CASE 0
#endif

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
#if CASE == 1
  FIELD(Int, four, "1");
#elif CASE == 2
  Int four;
#elif CASE == 3
  FIELD(Int, four);
#endif
  CODING_KEYS(Schema);
};

struct Record {
#if CASE == 4
  FIELD(String, two);
  FIELD(Int, one);
#else
  FIELD(Int, one);
  FIELD(String, two);
#endif
  FIELD(Optional<InnerRecord>, three);
  LABELS(Record);
};

static_assert(KeyTable<Schema>::find("1") == 0);

Record convert(Schema&& schema) {
#if CASE == 5
  return fieldByField<Record>(std::move(schema));
#elif CASE == 6
  return fieldByField<Record>(schema, label<&Record::three> = Optional<InnerRecord>());
#else
  return fieldByField<Record>(std::move(schema), label<&Record::three> = Optional<InnerRecord>());
#endif
}

Record byHand(Schema&& schema) {
#if CASE == 7
  return Keelgate::construct<Record>({.one = schema.one, .three = {}});
#elif CASE == 8
  return Keelgate::construct<Record>({.two = std::move(schema.two), .one = 1, .three = {}});
#else
  return Keelgate::construct<Record>(
      {.one = schema.one, .two = std::move(schema.two), .three = {}});
#endif
}

}  // namespace VespKeelgateService
