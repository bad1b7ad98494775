// SPDX-License-Identifier: Apache-2.0
#include "program/payload/vesp_ostrel_payload_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/schema/property_list_decoder.h"

namespace VespKeelgateService {

using Keelgate::constructInPlace;
using Keelgate::PulseUserPayload;

PulseUserPayload VespOstrelPayloadUnpacker::unpack(Bytes from) const {
  auto payload = PropertyListDecoder().decode<Schema, PulseUserPayload>(from);
  constructPayload(payload);
  return payload;
}

void VespOstrelPayloadUnpacker::constructPayload(const PulseUserPayload& payload) {
  // In this order, inner payloads first: it decides which error a message with several faults
  // gives.
  for (const PulseUserPayload& inner : payload.dstIdTokenList) constructPayload(inner);
  for (const PulseUserPayload& inner : payload.ostrelMessageList) constructPayload(inner);
  constructInPlace(payload.httpHeaders);
  constructInPlace(payload.deliveryContext);
  constructInPlace(payload.pluginRequests);
  constructInPlace(payload.allocationStatuses);
  constructInPlace(payload.selfAllocTokenList);
  constructInPlace(payload.pluginAllocations);
  constructInPlace(payload);
}

}  // namespace VespKeelgateService
