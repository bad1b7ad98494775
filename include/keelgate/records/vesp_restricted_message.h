// SPDX-License-Identifier: Apache-2.0
/// The marker that stands for a message whose content never leaves the sandbox.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

namespace Keelgate {

/// What the framework may do with a kind of message.
KEELGATE_ENUMERATION(ClientMessageType, UInt,
    (unrestricted, 0),
    (restricted, 1));

/// It is the same for every message of its service, so it leaks no content, and no decoder ever
/// reads the bytes. A value; separate ones may be used from separate threads.
struct VespRestrictedMessage {
  KEELGATE_RECORD(VespRestrictedMessage,
      (ClientMessageType, messageType));
};

}  // namespace Keelgate
