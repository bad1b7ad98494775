// SPDX-License-Identifier: Apache-2.0
/// What the unpackers of the single services share: their contract, their command tables, and the
/// dispatch by command that each of them begins with.
///
/// The tables are types, and the functions pure but for the log: callable from any thread.
#pragma once

#include "framework/contracts/unpacker.h"
#include "program/schema/values.h"

#include <keelgate/errors.h>

#include <algorithm>
#include <concepts>
#include <string_view>

namespace VespKeelgateService {

using Keelgate::CommandType;
using Keelgate::VespClientMessageContext;
using Keelgate::VespClientMessageResult;

/// An unpacker for the messages of one service. Its `Commands` say what it answers: `dispatch`,
/// `describe` and the fuzzers read the same table.
template <class U>
concept VespServiceUnpacker = Keelgate::ContextualUnpacker<U> &&
    std::same_as<typename U::SchemaType, VespClientMessageResult> && requires {
  typename U::Commands;
};

/// A record that a client message can give: a case of VespClientMessageType.
template <class R>
concept ClientMessageRecord = std::constructible_from<Keelgate::VespClientMessageType, R>;

/// A row of a command table: this command is decoded as S and gives an R.
template <CommandType::Case known, class S, ClientMessageRecord R>
struct On {
  static constexpr Optional<UInt64> command = CommandType(known).rawValue();
  using Schema = S;
  using Record = R;
};

/// A row for every command that the framework knows.
template <class S, ClientMessageRecord R>
struct OnAnyCommand {
  static constexpr Optional<UInt64> command = std::nullopt;
  using Schema = S;
  using Record = R;
};

/// The identifier of a row as a template argument, which a string literal by itself cannot be.
template <std::size_t n>
struct ServiceIdentifier {
  char text[n];
  consteval ServiceIdentifier(const char (&literal)[n]) { std::copy_n(literal, n, text); }
};

/// A row of the service table: an identifier, and the unpacker of what arrives under it.
template <ServiceIdentifier literal, class U>
struct Service {
  static constexpr std::string_view identifier{literal.text, sizeof(literal.text) - 1};
  using Unpacker = U;
};

/// The known command with the context's number. An unknown one is logged and refused; the message
/// is not even looked at.
CommandType checkCommand(const VespClientMessageContext& context);

/// What `body` gives for a row: a function for each, so that no frame holds what all rows need.
template <class Row, class Body>
VespClientMessageResult answerAs(Body& body) {
  return body(Row());
}

/// Calls `body` with the row that the table has for the context's command. The command alone
/// chooses it: a message that does not fit its row is never tried as another kind, which would let
/// its sender pick the reading that suits best. Throws Breach for an unknown command, and
/// VespClientMessageUnpackingError for one without a row.
template <class... Row, class Body>
VespClientMessageResult dispatch(Keelgate::TypeList<Row...>,
                                 const VespClientMessageContext& context, Body body) {
  const CommandType command = checkCommand(context);
  VespClientMessageResult (*answer)(Body&) = nullptr;
  ((Row::command.value_or(context.command) == context.command ? void(answer = answerAs<Row, Body>)
                                                              : void()),
   ...);
  if (answer == nullptr) throw VespClientMessageUnpackingError::unimplementedCommand(command);
  return answer(body);
}

}  // namespace VespKeelgateService
