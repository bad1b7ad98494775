// SPDX-License-Identifier: Apache-2.0
/// A message's whole way but for the processes: the service's unpackers, the reply, the client's
/// reader of it, and JSON.
///
/// One thread: the server is made at the first use.
#pragma once

#include "framework/server/keelgate_server.h"
#include "fuzz/messages/messages.h"

#include <string>

namespace Keelgate::Fuzz {

/// What the service answers, in this process.
Reply replyTo(const Target& target, Bytes message);

/// Reads an honest reply as the client does. Requires that it can be read, that it is the one
/// spelling of what it says, and that a record prints as JSON. What the two encodings of a message
/// must agree on, as text: a record's JSON or an error without its description.
std::string read(const Target& target, const Reply& reply);

}  // namespace Keelgate::Fuzz
