// SPDX-License-Identifier: Apache-2.0
#include "program/session/viso_audio_video_message_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/schema/property_list_decoder.h"

namespace VespKeelgateService {

using Keelgate::construct;

VespClientMessageResult VisoAudioVideoMessageUnpacker::unpack(Bytes from,
                                                              const Context& with) const {
  return dispatch(Commands(), with, [from]<class Row>(Row) {
    return VespClientMessageResult{
        .result = construct(
            PropertyListDecoder().decode<typename Row::Schema, typename Row::Record>(from))};
  });
}

}  // namespace VespKeelgateService
