// SPDX-License-Identifier: Apache-2.0
#include "program/session/viso_live_photo_message_unpacker.h"

#include "framework/contracts/construct.h"

namespace VespKeelgateService {

using Keelgate::ClientMessageType;
using Keelgate::construct;
using Keelgate::VespRestrictedMessage;

namespace {

template <class Row>
VespClientMessageResult answer(Keelgate::TypeList<Row>, CommandType command) {
  if (command.rawValue() != Row::command) {
    throw VespClientMessageUnpackingError::unimplementedCommand(command);
  }
  return {.result =
              construct<VespRestrictedMessage>({.messageType = ClientMessageType::restricted})};
}

}  // namespace

VespClientMessageResult VisoLivePhotoMessageUnpacker::unpack(Bytes, const Context& with) const {
  return checkingCommand(with, [](CommandType command) { return answer(Commands(), command); });
}

}  // namespace VespKeelgateService
