// SPDX-License-Identifier: Apache-2.0
#include "program/service/vesp_sample_message_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/schema/property_list_decoder.h"

namespace VespKeelgateService {

using Keelgate::construct;

VespClientMessageResult VespSampleMessageUnpacker::unpack(Bytes from, const Context& with) const {
  return dispatch(Commands(), with, [&]<class Row>(Row) {
    auto schema = PropertyListDecoder().decode<typename Row::Schema>(from);

    // Deliberate: the message's own command number, never compared with the context's.
    return VespClientMessageResult{.result = construct<typename Row::Record>({
                                       .command = schema.command,
                                       .clientName = std::move(schema.clientName),
                                       .date = schema.date,
                                       .version = schema.version,
                                   })};
  });
}

}  // namespace VespKeelgateService
