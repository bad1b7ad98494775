// SPDX-License-Identifier: Apache-2.0
/// The records inside push payloads and web-tunnel responses. A key is scoped to its own
/// dictionary, and means the same in each: "hlsk" is always a relay session key, "hli" always a
/// participant.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

namespace VespKeelgateService {

/// All of it is optional, here and below: an empty dictionary is a record of absent values.
struct VespOstrelProtocolHttpHeaders {
  KEELGATE_SCHEMA(VespOstrelProtocolHttpHeaders,
      (Optional<String>, adhocServiceOverride, "aS"),
      (Optional<String>, responseIdentifierString, "ri"),
      (Optional<String>, strictTransportSecurity, "strict-transport-security"),
      (Optional<String>, traceId, "x-b3-traceid"),
      (Optional<String>, splunkHint, "sh"),
      (Optional<String>, asHttpHeader, "as"));
};

struct VespOstrelProtocolDeliveryContext {
  KEELGATE_SCHEMA(VespOstrelProtocolDeliveryContext,
      (Optional<Int>, count, "c"));
};

struct VespHoplinePluginRequest {
  KEELGATE_SCHEMA(VespHoplinePluginRequest,
      (Optional<String>, pluginName, "qpln"),
      (Optional<String>, pluginConfig, "qplc"),
      (Optional<Int>, pluginStream, "qpls"),
      (Optional<Bool>, pluginDevMode, "qpld"));
};

/// For one participant; "t" and "tP" are its token and its destination.
struct VespHoplineAllocationStatus {
  KEELGATE_SCHEMA(VespHoplineAllocationStatus,
      (Optional<UInt64>, participantId, "hli"),
      (Optional<Int>, allocationStatus, "hls"),
      (Optional<Data>, token, "t"),
      (Optional<String>, destinationId, "tP"));
};

/// The keys are those of the payload's own relay.
struct VespHoplineSelfAllocToken {
  KEELGATE_SCHEMA(VespHoplineSelfAllocToken,
      (Optional<Data>, relayIp, "hlip"),
      (Optional<Data>, relayIpv6, "hlip6"),
      (Optional<Int>, relayPort, "hlp"),
      (Optional<Data>, relaySessionKey, "hlsk"),
      (Optional<Data>, relaySessionId, "hlsi"),
      (Optional<Data>, relayAccessToken, "hlst"),
      (Optional<Int>, relayProvider, "hlpr"));
};

struct VespHoplinePluginAllocation {
  KEELGATE_SCHEMA(VespHoplinePluginAllocation,
      (Optional<String>, pluginName, "qpln"),
      (Optional<Int>, pluginStream, "qpls"),
      (Optional<UInt64>, participantId, "hli"),
      (Optional<Data>, relaySessionKey, "hlsk"),
      (Optional<Data>, relayAccessToken, "hlst"));
};

}  // namespace VespKeelgateService
