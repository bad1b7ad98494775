// SPDX-License-Identifier: Apache-2.0
/// A safety check-in: one flat dictionary that addresses up to 32 groups of recipients. Every key
/// is spelt like its field. Codes are plain numbers here, so that an unknown one is not an error.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

namespace VespKeelgateService {

/// The field of a kind, for one group of recipients and for the groups 2 to 32.
#define NUMBERED(name_, number_) (Optional<String>, name_##number_)
#define GROUPS_2_TO_32(name_)                                                             \
  NUMBERED(name_, 2), NUMBERED(name_, 3), NUMBERED(name_, 4), NUMBERED(name_, 5),         \
      NUMBERED(name_, 6), NUMBERED(name_, 7), NUMBERED(name_, 8), NUMBERED(name_, 9),     \
      NUMBERED(name_, 10), NUMBERED(name_, 11), NUMBERED(name_, 12), NUMBERED(name_, 13), \
      NUMBERED(name_, 14), NUMBERED(name_, 15), NUMBERED(name_, 16), NUMBERED(name_, 17), \
      NUMBERED(name_, 18), NUMBERED(name_, 19), NUMBERED(name_, 20), NUMBERED(name_, 21), \
      NUMBERED(name_, 22), NUMBERED(name_, 23), NUMBERED(name_, 24), NUMBERED(name_, 25), \
      NUMBERED(name_, 26), NUMBERED(name_, 27), NUMBERED(name_, 28), NUMBERED(name_, 29), \
      NUMBERED(name_, 30), NUMBERED(name_, 31), NUMBERED(name_, 32)

/// Five fields are required, the first five. Neither ranges nor the company of coordinates are
/// checked.
struct WaymarkSchema {
  KEELGATE_SCHEMA(WaymarkSchema,
      (UInt, messageType),
      (UInt, interfaceVersion),
      (Double, sendDate),
      (String, messageID),
      (String, sessionID),
      (Optional<String>, summaryText),
      (Optional<String>, receiverHandle),
      (Optional<String>, sharingInvitationData),
      (Optional<String>, shareURL),
      (Optional<String>, participantID),
      (Optional<UInt>, sessionType),
      (Optional<Double>, estimatedEndTime),
      (Optional<Double>, coarseEstimatedEndTime),
      (Optional<UInt>, sessionDestinationType),
      (Optional<String>, sessionDestinationMapItem),
      (Optional<UInt>, lowPowerModeWarningState),
      // Times, degrees and metres are numbers here: neither their unit nor their epoch is looked
      // at.
      (Optional<Double>, triggerTime),
      (Optional<Double>, latitude),
      (Optional<Double>, longitude),
      (Optional<Double>, hunc),
      (Optional<Double>, altitude),
      (Optional<Double>, vunc),
      (Optional<Double>, timeOfLocation),
      (Optional<UInt>, referenceFrame),
      (Optional<Double>, speed),
      (Optional<UInt>, triggerType),
      (Optional<String>, safetyCacheKey),
      (Optional<String>, safetyCacheToken),
      (Optional<Bool>, isSOSTrigger),
      // The recipient groups 2 to 32. The four fields of the first group are the unnumbered ones
      // above.
      GROUPS_2_TO_32(receiverHandle),
      GROUPS_2_TO_32(sharingInvitationData),
      GROUPS_2_TO_32(shareURL),
      GROUPS_2_TO_32(participantID));
};

#undef GROUPS_2_TO_32
#undef NUMBERED

// 29 fields and 31 numbered ones in each of four families.
static_assert(WaymarkSchema::CodingKeys::size == 153);

}  // namespace VespKeelgateService
