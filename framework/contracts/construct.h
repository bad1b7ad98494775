// SPDX-License-Identifier: Apache-2.0
/// The throwing constructor of every record.
///
///     construct<VespSampleMessage>({.command = 7, .clientName = std::move(name), …});
///
/// It runs where a record is built, in the service, and again where it is read, in the client, so
/// that what the framework refuses is refused on both sides.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/type_name.h>

#include <string_view>

namespace Keelgate {

/// The framework's say on a record that is about to exist: it returns, or throws a Breach. The
/// framework accepts every value. A test that needs a constructor to refuse links its own
/// definition in place of this one, so no switch for it exists in what is shipped.
void admit(std::string_view record);

template <Record R>
R construct(R record) {
  admit(typeName<R>());
  return record;
}

/// The same for a record that has been filled in its place, and stays there.
template <Record R>
void constructInPlace(const R&) {
  admit(typeName<R>());
}

/// For each of a list, or for one if it is there. The first that is refused ends the message; no
/// list is ever shortened.
template <Record R>
void constructInPlace(const Array<R>& records) {
  for (const R& record : records) constructInPlace(record);
}
template <Record R>
void constructInPlace(const Optional<R>& record) {
  if (record) constructInPlace(*record);
}

}  // namespace Keelgate
