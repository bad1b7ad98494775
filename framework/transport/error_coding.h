// SPDX-License-Identifier: Apache-2.0
/// Errors as the bytes of a reply, both ways: a rejected message throws in the client what its
/// unpacker threw in the sandbox.
///
/// Pure functions; callable from any thread.
#pragma once

#include "framework/transport/wire.h"

#include <keelgate/errors.h>

namespace Keelgate::Transport {

/// The body of an error frame.
Data encodeError(const DecodingError& error);
Data encodeError(const Breach& error);
Data encodeError(const VespKeelgateService::VespClientMessageUnpackingError& error);

/// Throws the error that a body holds, MalformedReply when it does not hold one, ReadLimitReached
/// or std::bad_alloc. The bytes may be anything: of the error's fields only those that go together
/// are taken, and of its texts only UTF-8.
[[noreturn]] void throwError(Bytes body, const ReadLimits& limits = {});

}  // namespace Keelgate::Transport
