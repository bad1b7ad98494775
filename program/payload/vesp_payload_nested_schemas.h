// SPDX-License-Identifier: Apache-2.0
/// The records inside push payloads and web-tunnel responses. A key is scoped to its own
/// dictionary, and means the same in each: "hlsk" is always a relay session key, "hli" always a
/// participant.
#pragma once

#include "program/schema/values.h"

#include <keelgate/describe.h>

#include <keelgate/describe_begin.h>

namespace VespKeelgateService {

/// All of it is optional, here and below: an empty dictionary is a record of absent values.
struct VespOstrelProtocolHttpHeaders {
  FIELD(Optional<String>, adhocServiceOverride, "aS");
  FIELD(Optional<String>, responseIdentifierString, "ri");
  FIELD(Optional<String>, strictTransportSecurity, "strict-transport-security");
  FIELD(Optional<String>, traceId, "x-b3-traceid");
  FIELD(Optional<String>, splunkHint, "sh");
  FIELD(Optional<String>, asHttpHeader, "as");

  CODING_KEYS(VespOstrelProtocolHttpHeaders);
};

struct VespOstrelProtocolDeliveryContext {
  FIELD(Optional<Int>, count, "c");

  CODING_KEYS(VespOstrelProtocolDeliveryContext);
};

struct VespHoplinePluginRequest {
  FIELD(Optional<String>, pluginName, "qpln");
  FIELD(Optional<String>, pluginConfig, "qplc");
  FIELD(Optional<Int>, pluginStream, "qpls");
  FIELD(Optional<Bool>, pluginDevMode, "qpld");

  CODING_KEYS(VespHoplinePluginRequest);
};

/// For one participant; "t" and "tP" are its token and its destination.
struct VespHoplineAllocationStatus {
  FIELD(Optional<UInt64>, participantId, "hli");
  FIELD(Optional<Int>, allocationStatus, "hls");
  FIELD(Optional<Data>, token, "t");
  FIELD(Optional<String>, destinationId, "tP");

  CODING_KEYS(VespHoplineAllocationStatus);
};

/// The keys are those of the payload's own relay.
struct VespHoplineSelfAllocToken {
  FIELD(Optional<Data>, relayIp, "hlip");
  FIELD(Optional<Data>, relayIpv6, "hlip6");
  FIELD(Optional<Int>, relayPort, "hlp");
  FIELD(Optional<Data>, relaySessionKey, "hlsk");
  FIELD(Optional<Data>, relaySessionId, "hlsi");
  FIELD(Optional<Data>, relayAccessToken, "hlst");
  FIELD(Optional<Int>, relayProvider, "hlpr");

  CODING_KEYS(VespHoplineSelfAllocToken);
};

struct VespHoplinePluginAllocation {
  FIELD(Optional<String>, pluginName, "qpln");
  FIELD(Optional<Int>, pluginStream, "qpls");
  FIELD(Optional<UInt64>, participantId, "hli");
  FIELD(Optional<Data>, relaySessionKey, "hlsk");
  FIELD(Optional<Data>, relayAccessToken, "hlst");

  CODING_KEYS(VespHoplinePluginAllocation);
};

}  // namespace VespKeelgateService

#include <keelgate/describe_end.h>
