// SPDX-License-Identifier: Apache-2.0
/// Every error that keyed decoding can throw, built in one place.
///
/// Pure functions; callable from any thread. They give the error, and the caller throws it. Nothing
/// of the message stands in a description but the type that was found.
#pragma once

#include "plist/document.h"
#include "plist/malformed_document.h"
#include "program/schema/coding_path.h"

#include <keelgate/errors.h>

#include <string_view>

namespace VespKeelgateService::Errors {

using Keelgate::DecodingError;

/// A required key is missing from the dictionary at `path`.
DecodingError keyNotFound(const CodingPath& path, std::string_view key);

/// The value at `path` is none of the `expected` type.
DecodingError typeMismatch(const CodingPath& path, std::string_view expected,
                           PropertyList::Type found);

/// The dictionary at `path` does not hold the single key that names a case.
DecodingError notOneKey(const CodingPath& path);

/// The value at `path` is null, and may not be.
DecodingError valueNotFound(const CodingPath& path, std::string_view expected);

/// The number at `path` does not fit its field.
DecodingError numberDoesNotFit(const CodingPath& path, std::string_view expected);

/// The number at `path` is not a raw value of the enumeration.
DecodingError invalidRawValue(const CodingPath& path, std::string_view enumeration);

/// The string at `path` is not a UUID.
DecodingError invalidUUID(const CodingPath& path);

/// The message is not a property list, or expands out of proportion.
DecodingError malformed(const PropertyList::MalformedDocument& error, Keelgate::Bytes message);

}  // namespace VespKeelgateService::Errors
