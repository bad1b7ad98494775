// SPDX-License-Identifier: Apache-2.0
/// Routes a client message to the unpacker of the service that it arrived under.
#pragma once

#include "program/service_unpacker/vesp_service_unpacker.h"

#include <exception>
#include <functional>
#include <map>
#include <string_view>

namespace VespKeelgateService {

/// Stateless but for the map, which is never written after start-up: callable from any thread.
class VespClientMessageUnpacker {
 public:
  using SchemaType = VespClientMessageResult;
  using Context = VespClientMessageContext;

  /// For the services of a table. The same identifier twice is a programming error and ends the
  /// process.
  template <class... Row>
  explicit VespClientMessageUnpacker(Keelgate::TypeList<Row...>) {
    (add(Row::identifier, typename Row::Unpacker()), ...);
  }

  /// What the service's unpacker gives or throws, unchanged; or
  /// VespClientMessageUnpackingError::noUnpackerForService.
  VespClientMessageResult unpack(Bytes from, const Context& with) const;

 private:
  template <VespServiceUnpacker U>
  void add(std::string_view identifier, U unpacker) {
    const auto unpack = [unpacker](Bytes from, const Context& with) {
      return unpacker.unpack(from, with);
    };
    // Better no service than one whose second row is never asked.
    if (!serviceToUnpackerMap_.emplace(identifier, unpack).second) std::terminate();
  }

  /// Its keys are the program's own, and a look-up compares with each of them at most: nothing in a
  /// message can make it slow.
  std::map<String, std::function<VespClientMessageResult(Bytes from, const Context& with)>>
      serviceToUnpackerMap_;
};

}  // namespace VespKeelgateService
