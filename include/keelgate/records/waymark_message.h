// SPDX-License-Identifier: Apache-2.0
/// The record of a safety check-in. A code that the framework does not know becomes its default
/// case: a newer sender's check-in must still arrive, since someone may depend on it.
///
/// Values that own all that they hold; separate ones may be used from separate threads.
#pragma once

#include <keelgate/describe.h>
#include <keelgate/values.h>

namespace Keelgate {

/// The kind of check-in; the only code that is required.
KEELGATE_DEFAULTING_ENUMERATION(WMMessageType, UInt, unknown,
    (unknown, 0),
    (sessionStart, 1),
    (sessionUpdate, 2),
    (sessionEnd, 3),
    (trigger, 4),
    (cacheUpdate, 5),
    (locationUpdate, 6));

/// What ends the session.
KEELGATE_DEFAULTING_ENUMERATION(WMsessionType, UInt, unknown,
    (unknown, 0),
    (timer, 1),
    (destination, 2),
    (workout, 3));

KEELGATE_DEFAULTING_ENUMERATION(WMSessionDestinationType, UInt, unknown,
    (unknown, 0),
    (home, 1),
    (work, 2),
    (school, 3),
    (other, 4));

KEELGATE_DEFAULTING_ENUMERATION(WMDeviceConfigurationLowPowerModeWarningState, UInt, unknown,
    (unknown, 0),
    (notShown, 1),
    (shown, 2),
    (dismissed, 3));

/// What the coordinates refer to.
KEELGATE_DEFAULTING_ENUMERATION(GLClientLocationReferenceFrame, UInt, unknown,
    (unknown, 0),
    (wgs84, 1),
    (shifted, 2));

/// What triggered it on the sender's device.
KEELGATE_DEFAULTING_ENUMERATION(WMTriggerCategory, UInt, unknown,
    (unknown, 0),
    (timerExpired, 1),
    (noProgress, 2),
    (offRoute, 3),
    (unresponsive, 4),
    (emergency, 5));

/// One group of recipients. Receivers know a group by its number, not by its position in the list.
/// An empty group is kept: its number only says that it may have recipients.
struct WaymarkGroupFields {
  KEELGATE_RECORD(WaymarkGroupFields,
      /// 2 to 32.
      (UInt, groupNumber),
      (Optional<String>, receiverHandle),
      (Optional<String>, sharingInvitationData),
      (Optional<String>, shareURL),
      (Optional<String>, participantID));
};

/// Times, angles, lengths and speeds are as the sender counts them. The first group of recipients
/// is in the record itself; `groupFields` has the groups 2 to 32, empty ones too. No field depends
/// on another: a latitude may come without a longitude.
struct WaymarkMessage {
  KEELGATE_RECORD(WaymarkMessage,
      (WMMessageType, messageType),
      /// The protocol version that the sender speaks.
      (UInt, interfaceVersion),
      /// When it was sent, as which message of which check-in.
      (Double, sendDate),
      (String, messageID),
      (String, sessionID),
      (Optional<String>, summaryText),
      /// The first group of recipients.
      (Optional<String>, receiverHandle),
      (Optional<String>, sharingInvitationData),
      (Optional<String>, shareURL),
      (Optional<String>, participantID),
      /// What the check-in is about, and when it should end.
      (Optional<WMsessionType>, sessionType),
      (Optional<Double>, estimatedEndTime),
      (Optional<Double>, coarseEstimatedEndTime),
      (Optional<WMSessionDestinationType>, sessionDestinationType),
      (Optional<String>, sessionDestinationMapItem),
      /// What the sender's device last warned about.
      (Optional<WMDeviceConfigurationLowPowerModeWarningState>, lowPowerModeWarningState),
      /// What triggered it, when and where. Degrees, metres and metres per second, as the sender
      /// measured them; hunc and vunc are the horizontal and vertical uncertainty.
      (Optional<Double>, triggerTime),
      (Optional<Double>, latitude),
      (Optional<Double>, longitude),
      (Optional<Double>, hunc),
      (Optional<Double>, altitude),
      (Optional<Double>, vunc),
      (Optional<Double>, timeOfLocation),
      (Optional<GLClientLocationReferenceFrame>, referenceFrame),
      (Optional<Double>, speed),
      (Optional<WMTriggerCategory>, triggerType),
      /// Where the sender stored its last known state for the recipients.
      (Optional<String>, safetyCacheKey),
      (Optional<String>, safetyCacheToken),
      (Optional<Bool>, isSOSTrigger),
      /// Always present, with 31 groups.
      (Optional<Array<WaymarkGroupFields>>, groupFields));
};

}  // namespace Keelgate
