// SPDX-License-Identifier: Apache-2.0
#include "program/service/vesp_sample_message_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/schema/property_list_decoder.h"

namespace VespKeelgateService {

using Keelgate::construct;
using Keelgate::VespSampleMessage;

VespClientMessageResult VespSampleMessageUnpacker::unpack(Bytes from, const Context& with) const {
  return checkingCommand(with, [&] {
    auto schema = PropertyListDecoder().decode<VespSampleMessageSchema>(from);

    // Deliberate: the message's own command number, never compared with the context's.
    return VespClientMessageResult{.result = construct<VespSampleMessage>({
                                       .command = schema.command,
                                       .clientName = std::move(schema.clientName),
                                       .date = schema.date,
                                       .version = schema.version,
                                   })};
  });
}

}  // namespace VespKeelgateService
