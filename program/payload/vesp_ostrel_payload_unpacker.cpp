// SPDX-License-Identifier: Apache-2.0
#include "program/payload/vesp_ostrel_payload_unpacker.h"

#include "program/payload/payload_conversions.h"
#include "program/schema/property_list_decoder.h"

namespace VespKeelgateService {

using Keelgate::construct;
using Keelgate::PulseHoplineAllocationStatus;
using Keelgate::PulseHoplinePluginAllocation;
using Keelgate::PulseHoplinePluginRequest;
using Keelgate::PulseHoplineSelfAllocToken;
using Keelgate::PulseUserPayload;
using Keelgate::PulseUserPayloadDeliveryContext;
using Keelgate::PulseUserPayloadHttpHeaders;

PulseUserPayload VespOstrelPayloadUnpacker::unpack(Bytes from) const {
  return convertPayload(PropertyListDecoder().decode<Schema>(from));
}

PulseUserPayload VespOstrelPayloadUnpacker::convertPayload(VespOstrelProtocolPayload&& payload) {
  // In this order, inner payloads first: it decides which error a message with several faults
  // gives.
  auto tokens = convertEach(std::move(payload.dstIdTokenList), convertPayload);
  auto messages = convertEach(std::move(payload.ostrelMessageList), convertPayload);
  auto headers = convertIfPresent<PulseUserPayloadHttpHeaders>(std::move(payload.httpHeaders));
  auto context =
      convertIfPresent<PulseUserPayloadDeliveryContext>(std::move(payload.deliveryContext));
  auto requests = convertEach<PulseHoplinePluginRequest>(std::move(payload.pluginRequests));
  auto statuses = convertEach<PulseHoplineAllocationStatus>(std::move(payload.allocationStatuses));
  auto selfTokens = convertEach<PulseHoplineSelfAllocToken>(std::move(payload.selfAllocTokenList));
  auto allocations =
      convertEach<PulseHoplinePluginAllocation>(std::move(payload.pluginAllocations));

  // The eight fields that change their type; the compiler checks that the other 148 do not.
  return construct(fieldByField<PulseUserPayload>(
      std::move(payload),  //
      label<&PulseUserPayload::deliveryContext> = std::move(context),
      label<&PulseUserPayload::dstIdTokenList> = std::move(tokens),
      label<&PulseUserPayload::ostrelMessageList> = std::move(messages),
      label<&PulseUserPayload::httpHeaders> = std::move(headers),
      label<&PulseUserPayload::pluginRequests> = std::move(requests),
      label<&PulseUserPayload::allocationStatuses> = std::move(statuses),
      label<&PulseUserPayload::selfAllocTokenList> = std::move(selfTokens),
      label<&PulseUserPayload::pluginAllocations> = std::move(allocations)));
}

}  // namespace VespKeelgateService
