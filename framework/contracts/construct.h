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
#include <utility>

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

}  // namespace Keelgate
