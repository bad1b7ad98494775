// SPDX-License-Identifier: Apache-2.0
/// What every client message gives: one record, under the name of its kind. Values that own all
/// that they hold; separate ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/records/vesp_restricted_message.h>
#include <keelgate/records/vesp_sample_message.h>
#include <keelgate/records/vesp_session.h>
#include <keelgate/records/waymark_message.h>
#include <variant>

#include <keelgate/describe_begin.h>

namespace Keelgate {

/// One case for each kind. A new kind of client message is one more alternative here. In a
/// std::visit the compiler then shows every place that has to know it. The position of an
/// alternative travels between service and client, which are always of one build.
struct VespClientMessageType
    : std::variant<VespSampleMessage, VespSessionInvitation, VespSessionAccept, VespSessionDecline,
                   VespSessionCancel, VespSessionReinitiate, VespRestrictedMessage,
                   WaymarkMessage> {
  CASES(VespClientMessageType, vespSampleMessage, sessionInvitation, sessionAccept, sessionDecline,
        sessionCancel, sessionReinitiate, messageTypeRestricted, waymarkMessage);
};

/// The one record whose JSON is not an object of its own, but its case.
struct VespClientMessageResult {
  FIELD(VespClientMessageType, result);

  LABELS(VespClientMessageResult);
};

}  // namespace Keelgate

#include <keelgate/describe_end.h>
