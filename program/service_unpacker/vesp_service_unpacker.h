// SPDX-License-Identifier: Apache-2.0
/// What the unpackers of the single services share: their contract, their command tables, and the
/// check of the command number that each of them begins with.
///
/// The tables are types, and the functions pure but for the log: callable from any thread.
#pragma once

#include "framework/contracts/unpacker.h"
#include "program/schema/values.h"

#include <keelgate/errors.h>

#include <algorithm>
#include <concepts>
#include <string_view>
#include <utility>

namespace VespKeelgateService {

using Keelgate::CommandType;
using Keelgate::VespClientMessageContext;
using Keelgate::VespClientMessageResult;

/// An unpacker for the messages of one service. Its `Commands` say what it answers; dispatch and
/// `describe` read the same table.
template <class U>
concept VespServiceUnpacker = Keelgate::ContextualUnpacker<U> &&
    std::same_as<typename U::SchemaType, VespClientMessageResult> && requires {
  typename U::Commands;
};

/// A row of a command table: this command is decoded as S and gives an R.
template <CommandType::Case known, class S, class R>
struct On {
  static constexpr Optional<UInt64> command = CommandType(known).rawValue();
  using Schema = S;
  using Record = R;
};

/// A row for every command that the framework knows.
template <class S, class R>
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

/// Runs the body of a service unpacker for a known command, and hands it the command if it wants.
template <class Body>
VespClientMessageResult checkingCommand(const VespClientMessageContext& context, Body&& body) {
  const CommandType command = checkCommand(context);
  if constexpr (std::invocable<Body, CommandType>) {
    return std::forward<Body>(body)(command);
  } else {
    return std::forward<Body>(body)();
  }
}

}  // namespace VespKeelgateService
