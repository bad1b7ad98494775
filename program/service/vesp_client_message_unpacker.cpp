// SPDX-License-Identifier: Apache-2.0
#include "program/service/vesp_client_message_unpacker.h"

namespace VespKeelgateService {

const AnyServiceUnpacker* ServiceToUnpackerMap::find(const String& service) const {
  // Bytes are compared. No text outside ASCII is canonically equivalent to one of the identifiers,
  // so this is equality of text too.
  const auto entry = entries_.find(service);
  return entry == entries_.end() ? nullptr : &entry->second;
}

void ServiceToUnpackerMap::insert(String service, AnyServiceUnpacker unpacker) {
  const bool isNew = entries_.emplace(std::move(service), std::move(unpacker)).second;
  // Better no service than one whose second row is never asked.
  if (!isNew) std::terminate();
}

VespClientMessageResult VespClientMessageUnpacker::unpack(Bytes from, const Context& with) const {
  const AnyServiceUnpacker* unpacker = serviceToUnpackerMap_.find(with.service);
  if (unpacker == nullptr) {
    // As it was received, and not logged: whoever sent it would write into the log at will.
    throw VespClientMessageUnpackingError::noUnpackerForService(with.service);
  }
  return (*unpacker)(from, with);
}

}  // namespace VespKeelgateService
