// SPDX-License-Identifier: Apache-2.0
/// The lines of `keelgate stream`.
///
///     {"record": TYPE, "message": BASE64, "id": ANY}      ("typed": true with PropertyList)
///     {"service": ID, "command": N, "message": BASE64, "id": ANY}
///
/// Read strictly, because a request that is understood otherwise than it was meant unpacks a
/// message as what it is not: a key that is unknown or stands twice, a number with a fraction,
/// base64 without its padding, invalid UTF-8 are all refused.
#pragma once

#include "framework/json/reply.h"

#include <keelgate/values.h>

#include <span>
#include <string_view>
#include <variant>

namespace Keelgate::CLI {

struct StreamRequest {
  JSON::Subject subject;
  /// In the memory of the line.
  Bytes message;
  Bool typed;
};

struct RequestLine {
  /// The request's id as compact JSON, with its numbers as they were written. Present with an
  /// invalid request too, as long as the line is JSON and has one id.
  Optional<String> id;
  /// The request, or why the line is not one.
  std::variant<StreamRequest, String> content;
};

/// Reads one line, without its newline, in its own memory, which holds the message then. Callable
/// from any thread. A nesting of any depth in the id takes heap and no stack. Throws nothing but
/// std::bad_alloc.
RequestLine readRequestLine(std::span<char> line);

/// A decimal number without a sign; nothing when it is not one or does not fit.
Optional<UInt64> decimal(std::string_view text);

}  // namespace Keelgate::CLI
