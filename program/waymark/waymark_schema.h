// SPDX-License-Identifier: Apache-2.0
/// A safety check-in: one flat dictionary that addresses up to 32 groups of recipients. Every key
/// is spelt like its field. Codes are plain numbers here, so that an unknown one is no error.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

/// Five fields are required, the first five. Neither ranges nor the company of coordinates are
/// checked.
struct WaymarkSchema {
  FIELD(UInt, messageType);
  FIELD(UInt, interfaceVersion);
  FIELD(Double, sendDate);
  FIELD(String, messageID);
  FIELD(String, sessionID);
  FIELD(Optional<String>, summaryText);
  FIELD(Optional<String>, receiverHandle);
  FIELD(Optional<String>, sharingInvitationData);
  FIELD(Optional<String>, shareURL);
  FIELD(Optional<String>, participantID);
  FIELD(Optional<UInt>, sessionType);
  FIELD(Optional<Double>, estimatedEndTime);
  FIELD(Optional<Double>, coarseEstimatedEndTime);
  FIELD(Optional<UInt>, sessionDestinationType);
  FIELD(Optional<String>, sessionDestinationMapItem);
  FIELD(Optional<UInt>, lowPowerModeWarningState);
  // Times, degrees and metres are numbers here: neither their unit nor their epoch is looked at.
  FIELD(Optional<Double>, triggerTime);
  FIELD(Optional<Double>, latitude);
  FIELD(Optional<Double>, longitude);
  FIELD(Optional<Double>, hunc);
  FIELD(Optional<Double>, altitude);
  FIELD(Optional<Double>, vunc);
  FIELD(Optional<Double>, timeOfLocation);
  FIELD(Optional<UInt>, referenceFrame);
  FIELD(Optional<Double>, speed);
  FIELD(Optional<UInt>, triggerType);
  FIELD(Optional<String>, safetyCacheKey);
  FIELD(Optional<String>, safetyCacheToken);
  FIELD(Optional<Bool>, isSOSTrigger);
  // The recipient groups 2 to 32. The four fields of the first group are the unnumbered ones above.
  FIELD_FAMILY(Optional<String>, receiverHandle);
  FIELD_FAMILY(Optional<String>, sharingInvitationData);
  FIELD_FAMILY(Optional<String>, shareURL);
  FIELD_FAMILY(Optional<String>, participantID);

  CODING_KEYS(WaymarkSchema);
};

// 29 fields and 31 numbered ones in each of four families.
static_assert(WaymarkSchema::CodingKeys::size == 153);

}  // namespace VespKeelgateService

#include <keelgate/describe_end.h>
