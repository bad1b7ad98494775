// SPDX-License-Identifier: Apache-2.0
/// Any property list as the tree that it is. There is no schema: every sound document is accepted.
#pragma once

#include "program/schema/values.h"

#include <keelgate/records/property_list.h>

namespace VespKeelgateService {

/// A value without fields; callable from any thread.
struct PropertyListUnpacker {
  using SchemaType = Keelgate::PropertyList;
  using Schema = NoSchema;

  /// Throws DecodingError. Takes stack for every container inside a container: at most 512 of them.
  SchemaType unpack(Bytes from) const;
};

}  // namespace VespKeelgateService
