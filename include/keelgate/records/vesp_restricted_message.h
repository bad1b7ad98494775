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

/// It is the same for every message of its service. So it cannot leak any, and bytes that would
/// harm a decoder never meet one.
struct VespRestrictedMessage {
  KEELGATE_RECORD(VespRestrictedMessage,
      (ClientMessageType, messageType));
};

}  // namespace Keelgate
