// SPDX-License-Identifier: Apache-2.0
/// The result of every client message: one record, under the name of its kind. Values that own all
/// that they hold; separate ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/records/vesp_restricted_message.h>
#include <keelgate/records/vesp_sample_message.h>
#include <keelgate/records/vesp_session.h>
#include <keelgate/records/waymark_message.h>

namespace Keelgate {

/// One case for each kind of client message. The compiler rejects a std::visit that lacks a new
/// one. The position of an alternative travels between service and client, which are always of the
/// same build.
KEELGATE_CASES(VespClientMessageType,
    (VespSampleMessage, vespSampleMessage),
    (VespSessionInvitation, sessionInvitation),
    (VespSessionAccept, sessionAccept),
    (VespSessionDecline, sessionDecline),
    (VespSessionCancel, sessionCancel),
    (VespSessionReinitiate, sessionReinitiate),
    (VespRestrictedMessage, messageTypeRestricted),
    (WaymarkMessage, waymarkMessage));

/// Its JSON is that of its only field: an object with the case as its key.
struct VespClientMessageResult {
  KEELGATE_RECORD(VespClientMessageResult,
      (VespClientMessageType, result));
};

}  // namespace Keelgate
