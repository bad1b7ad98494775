// SPDX-License-Identifier: Apache-2.0
#include "program/session/viso_live_photo_message_unpacker.h"

#include "framework/contracts/construct.h"

namespace VespKeelgateService {

using Keelgate::ClientMessageType;
using Keelgate::construct;

VespClientMessageResult VisoLivePhotoMessageUnpacker::unpack(Bytes, const Context& with) const {
  return dispatch(Commands(), with, []<class Row>(Row) {
    return VespClientMessageResult{
        .result = construct<typename Row::Record>({.messageType = ClientMessageType::restricted})};
  });
}

}  // namespace VespKeelgateService
