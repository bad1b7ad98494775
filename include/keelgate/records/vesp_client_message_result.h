// SPDX-License-Identifier: Apache-2.0
/// What every client message gives: one record, under the name of its kind. Values that own all
/// that they hold; separate ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/records/vesp_restricted_message.h>
#include <keelgate/records/vesp_sample_message.h>
#include <keelgate/records/vesp_session.h>
#include <keelgate/records/waymark_message.h>

namespace Keelgate {

/// One case for each kind. A new kind of client message is one more alternative here. In a
/// std::visit the compiler then shows every place that has to know it. The position of an
/// alternative travels between service and client, which are always of one build.
KEELGATE_CASES(VespClientMessageType,
    (VespSampleMessage, vespSampleMessage),
    (VespSessionInvitation, sessionInvitation),
    (VespSessionAccept, sessionAccept),
    (VespSessionDecline, sessionDecline),
    (VespSessionCancel, sessionCancel),
    (VespSessionReinitiate, sessionReinitiate),
    (VespRestrictedMessage, messageTypeRestricted),
    (WaymarkMessage, waymarkMessage));

/// The one record whose JSON is not an object of its own, but its case.
struct VespClientMessageResult {
  KEELGATE_RECORD(VespClientMessageResult,
      (VespClientMessageType, result));
};

}  // namespace Keelgate
