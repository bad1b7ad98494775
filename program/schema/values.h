// SPDX-License-Identifier: Apache-2.0
/// The framework's value types under the program's own names, for the schema headers.
///
/// Aliases alone. Schema headers include nothing that decodes, so that `describe` can list them
/// without a decoder being linked.
#pragma once

#include <keelgate/values.h>

namespace VespKeelgateService {

using Keelgate::Array;
using Keelgate::Bool;
using Keelgate::Bytes;
using Keelgate::Data;
using Keelgate::Date;
using Keelgate::Double;
using Keelgate::Int;
using Keelgate::Int64;
using Keelgate::Optional;
using Keelgate::String;
using Keelgate::UInt;
using Keelgate::UInt64;
using Keelgate::UUID;

/// Stands where a schema would, of a message that is not decoded by one.
struct NoSchema {};

/// A dictionary as a schema that decodes itself sees it.
class KeyedContainer;

}  // namespace VespKeelgateService
