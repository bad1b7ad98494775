// SPDX-License-Identifier: Apache-2.0
/// Errors as the bytes of a reply, both ways: a rejected message throws in the client what its
/// unpacker threw in the sandbox.
///
/// Pure functions; callable from any thread.
#pragma once

#include <keelgate/errors.h>

namespace Keelgate::Transport {

/// The body of an error frame.
Data encodeError(const DecodingError& error);
Data encodeError(const Breach& error);
Data encodeError(const VespKeelgateService::VespClientMessageUnpackingError& error);

/// Throws the error that a body holds, or MalformedReply when it holds none. The bytes may be a
/// lie: of the error's fields only those that go together are taken, and of its texts only UTF-8.
[[noreturn]] void throwError(Bytes body);

}  // namespace Keelgate::Transport
