// SPDX-License-Identifier: Apache-2.0
/// Routes a client message to the unpacker of the service that it arrived under.
#pragma once

#include "program/service_unpacker/vesp_service_unpacker.h"

#include <functional>
#include <map>
#include <utility>

namespace VespKeelgateService {

/// Any service unpacker, by value.
using AnyServiceUnpacker =
    std::function<VespClientMessageResult(Bytes from, const VespClientMessageContext& with)>;

/// From service identifiers to unpackers; never changed once it is made. Its keys are the
/// program's own, and a look-up compares with each of them at most: nothing in a message can make
/// it slow.
class ServiceToUnpackerMap {
 public:
  /// One entry for each row, in the order of the rows. The same identifier twice is a programming
  /// error and ends the process.
  template <class... Row>
  explicit ServiceToUnpackerMap(Keelgate::TypeList<Row...>) {
    (insert(
         String(Row::identifier),
         [unpacker = typename Row::Unpacker()](Bytes from, const VespClientMessageContext& with) {
           return unpacker.unpack(from, with);
         }),
     ...);
    static_assert((VespServiceUnpacker<typename Row::Unpacker> && ...));
  }

  /// The unpacker for exactly this identifier, or nullptr.
  [[nodiscard]] const AnyServiceUnpacker* find(const String& service) const;

 private:
  void insert(String service, AnyServiceUnpacker unpacker);

  std::map<String, AnyServiceUnpacker> entries_;
};

/// Stateless but for the map, which is never written after start-up: callable from any thread.
class VespClientMessageUnpacker {
 public:
  using SchemaType = VespClientMessageResult;
  using Context = VespClientMessageContext;

  explicit VespClientMessageUnpacker(ServiceToUnpackerMap serviceToUnpackerMap)
      : serviceToUnpackerMap_(std::move(serviceToUnpackerMap)) {}

  /// What the service's unpacker gives or throws, unchanged; or
  /// VespClientMessageUnpackingError::noUnpackerForService.
  VespClientMessageResult unpack(Bytes from, const Context& with) const;

 private:
  ServiceToUnpackerMap serviceToUnpackerMap_;
};

}  // namespace VespKeelgateService
