// SPDX-License-Identifier: Apache-2.0
#include "program/service/vesp_client_message_unpacker.h"

namespace VespKeelgateService {

VespClientMessageResult VespClientMessageUnpacker::unpack(Bytes from, const Context& with) const {
  // Bytes are compared. No text outside ASCII is canonically equivalent to one of the identifiers,
  // so this is equality of text too.
  const auto entry = serviceToUnpackerMap_.find(with.service);
  if (entry == serviceToUnpackerMap_.end()) {
    // As it was received, and not logged: whoever sent it would write into the log at will.
    throw VespClientMessageUnpackingError::noUnpackerForService(with.service);
  }
  return entry->second(from, with);
}

}  // namespace VespKeelgateService
