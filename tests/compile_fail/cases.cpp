// SPDX-License-Identifier: Apache-2.0
// Mistakes that must not compile, one for each value of CASE; without CASE it all compiles. The
// message that each must give stands beside it, and run.py looks for it. A mistake that clang does
// not see is expected of g++ alone.
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
#if CASE == 1  // expect: two fields of a schema travel under one wire key
  FIELD(Int, four, "1");
#elif CASE == 2  // expect: a member of the schema is not in its list of fields
  Int four;
#elif CASE == 3  // expect: the schema and the record have different numbers of fields
  FIELD(Int, four);
#endif
  CODING_KEYS(Schema);
};

struct Record {
#if CASE == 4  // expect: has another name than the schema's field at its position
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
#if CASE == 5  // expect: a field changes its type on the way and has no label
  return fieldByField<Record>(std::move(schema));
#elif CASE == 6  // expect: fieldByField consumes its schema
  return fieldByField<Record>(schema, label<&Record::three> = Optional<InnerRecord>());
#else
  return fieldByField<Record>(std::move(schema), label<&Record::three> = Optional<InnerRecord>());
#endif
}

Record byHand(Schema&& schema) {
#if CASE == 7  // expect g++: missing (initializer for member|field) .*two
  return Keelgate::construct<Record>({.one = schema.one, .three = {}});
#elif CASE == 8  // expect: (does not match declaration order|out of declaration order|previous
                 // initialization|specified in the order)
  return Keelgate::construct<Record>({.two = std::move(schema.two), .one = 1, .three = {}});
#else
  return Keelgate::construct<Record>(
      {.one = schema.one, .two = std::move(schema.two), .three = {}});
#endif
}

}  // namespace VespKeelgateService
