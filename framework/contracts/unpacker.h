// SPDX-License-Identifier: Apache-2.0
/// The two contracts that a program's unpacker can fulfil. An unpacker is a stateless value: it may
/// be called any number of times, from any thread. It gives one record or throws.
#pragma once

#include <keelgate/records.h>

#include <concepts>

namespace Keelgate {

/// For a kind of message that is known by the record that is asked for.
template <class U>
concept MessageUnpacker = requires(const U& unpacker, Bytes from) {
  typename U::SchemaType;
  { unpacker.unpack(from) } -> std::same_as<typename U::SchemaType>;
};

/// For a kind of message that is told by what it arrived with. `from` and `with` are borrowed for
/// the time of the call.
template <class U>
concept ContextualUnpacker = requires(const U& unpacker, Bytes from,
                                      const typename U::Context& with) {
  typename U::SchemaType;
  { unpacker.unpack(from, with) } -> std::same_as<typename U::SchemaType>;
};

/// What the payload of an invitation must be: a schema, so that it can be decoded and encoded.
template <class T>
concept VespInvitationClientPayload = Schema<T>;

}  // namespace Keelgate
