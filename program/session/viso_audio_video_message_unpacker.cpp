// SPDX-License-Identifier: Apache-2.0
#include "program/session/viso_audio_video_message_unpacker.h"

#include "framework/contracts/construct.h"
#include "program/schema/property_list_decoder.h"

namespace VespKeelgateService {

using Keelgate::construct;

namespace {

/// The command alone chose the row: a message that does not fit it is never tried as another kind,
/// which would let its sender pick the reading that suits best.
template <class Row>
VespClientMessageResult unpackAs(Bytes from) {
  return {.result = construct(
              PropertyListDecoder().decode<typename Row::Schema, typename Row::Record>(from))};
}

/// A walk over the rows of the table, of which at most one has the number.
template <class... Row>
VespClientMessageResult unpackCommand(Keelgate::TypeList<Row...>, CommandType command, Bytes from) {
  VespClientMessageResult (*unpack)(Bytes) = nullptr;
  ((command.rawValue() == Row::command ? void(unpack = unpackAs<Row>) : void()), ...);
  if (unpack == nullptr) throw VespClientMessageUnpackingError::unimplementedCommand(command);
  return unpack(from);
}

}  // namespace

VespClientMessageResult VisoAudioVideoMessageUnpacker::unpack(Bytes from,
                                                              const Context& with) const {
  return checkingCommand(
      with, [&](CommandType command) { return unpackCommand(Commands(), command, from); });
}

}  // namespace VespKeelgateService
