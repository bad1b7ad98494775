// SPDX-License-Identifier: Apache-2.0
/// From the nested schemas of payloads to their records: straight copies, in order.
///
/// Pure functions; callable from any thread. What they are given they consume.
#pragma once

#include "framework/contracts/construct.h"
#include "program/payload/vesp_payload_nested_schemas.h"
#include "program/schema/field_by_field.h"

#include <keelgate/records/pulse_user_payload.h>

#include <utility>

namespace VespKeelgateService {

/// Throws what the record's constructor throws.
template <class R, class S>
R convert(S&& schema) {
  return Keelgate::construct(fieldByField<R>(std::forward<S>(schema)));
}

/// Absent stays absent: a missing dictionary becomes no record, an empty one becomes a record.
template <class R, class S>
Optional<R> convertIfPresent(Optional<S>&& schema) {
  if (!schema) return std::nullopt;
  return convert<R>(*std::move(schema));
}

/// Deliberate: the record cannot tell an absent list from an empty one. The first element that is
/// refused ends the message; no list is ever shortened.
template <class R, class S>
Array<R> convertEach(Optional<Array<S>>&& schemas, R (*convertOne)(S&&) = convert<R, S>) {
  Array<R> records;
  if (!schemas) return records;
  records.reserve(schemas->size());
  for (S& schema : *schemas) records.push_back(convertOne(std::move(schema)));
  return records;
}

}  // namespace VespKeelgateService
