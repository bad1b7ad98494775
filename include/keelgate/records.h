// SPDX-License-Identifier: Apache-2.0
/// Every record that an unpacker can give.
///
/// Records are aggregates: a record is built with designated initialisers, in the order of its
/// fields, and `construct` decides whether the framework accepts it. Absent values are empty
/// optionals. All of them are plain values that own what they hold.
#pragma once

#include <keelgate/records/property_list.h>
#include <keelgate/records/pulse_user_payload.h>
#include <keelgate/records/vesp_client_message_result.h>
#include <keelgate/records/vesp_command_response.h>
#include <keelgate/records/vesp_command_web_tunnel_response.h>
#include <keelgate/records/vesp_invitation.h>

#include <cstddef>
#include <type_traits>

namespace Keelgate {

/// A list of types that is walked at compile time. A value of it is an empty tag.
template <class... T>
struct TypeList {
  static constexpr std::size_t size = sizeof...(T);

  /// Calls `visitor(std::type_identity<T>())` for each type in order.
  template <class Visitor>
  static constexpr void each(Visitor&& visitor) {
    (visitor(std::type_identity<T>()), ...);
  }
};

/// The output records. The position of a record in the list is its number in the protocol between
/// client and service, which are always of the same build.
using OutputRecords = TypeList<PulseUserPayload, VespCommandResponse, VespCommandWebTunnelResponse,
                               VespInvitation, PropertyList, VespClientMessageResult>;

namespace Detail {
// The fold stops at the type; a type that is not in the list has its length for position.
template <class T, class... All>
constexpr std::size_t positionOf(TypeList<All...>) {
  std::size_t position = 0;
  static_cast<void>(((std::is_same_v<T, All> ? false : (++position, true)) && ...));
  return position;
}
}  // namespace Detail

/// A record that an unpacker is registered for.
template <class T>
concept OutputRecord = Detail::positionOf<T>(OutputRecords())
< OutputRecords::size;

/// The number of the record in a request, and the position of its unpacker in the server.
template <OutputRecord T>
constexpr std::size_t recordNumber = Detail::positionOf<T>(OutputRecords());

/// The context that comes with every client message. The caller sets it from what delivered the
/// message. An attacker may choose both values: a message can be sent to any service with any
/// command number.
struct VespClientMessageContext {
  /// Any number; one that CommandType does not know gives a Breach.
  UInt64 command;
  /// The delivery-service topic that the message arrived under. Compared exactly: upper and lower
  /// case differ.
  String service;
};

}  // namespace Keelgate
