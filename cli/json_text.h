// SPDX-License-Identifier: Apache-2.0
/// Single values as JSON text: what a JSON library does not settle, or settles otherwise than this
/// command promises.
///
/// Pure functions, callable from any thread; they throw nothing but std::bad_alloc unless they say
/// so.
#pragma once

#include <keelgate/values.h>

#include <string_view>

namespace Keelgate::CLI {

/// A JSON string with its quotes. Control characters are escaped up to U+009F and not only up to
/// U+001F: a message must not be able to drive the terminal that its record is printed on. So are
/// U+2028 and U+2029: many languages split lines there, and a reply is one line. What is no UTF-8
/// (only a path can hold such bytes) becomes U+FFFD.
String jsonString(std::string_view text);

/// Whether `text` is well-formed UTF-8.
Bool isUtf8(std::string_view text);

/// The shortest text that reads back to the same value, always with a fraction or an exponent;
/// "nan", "inf" and "-inf" with quotes, since JSON has no such numbers.
String numberText(Double value);

/// RFC 3339 in UTC with quotes, rounded to microseconds, without trailing zeros. A date whose year
/// does not have four digits is the number of seconds since 2001-01-01T00:00:00Z.
String dateText(Date date);

/// Upper-case, with quotes.
String uuidText(const UUID& uuid);

/// Base64 with padding and quotes.
String base64Text(Bytes bytes);

/// The octets that padded base64 stands for; nothing when it has any other character, no or wrong
/// padding, or bits that belong to no octet.
Optional<Data> fromBase64(std::string_view text);

}  // namespace Keelgate::CLI
