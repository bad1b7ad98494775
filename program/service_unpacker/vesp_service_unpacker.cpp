// SPDX-License-Identifier: Apache-2.0
#include "program/service_unpacker/vesp_service_unpacker.h"

#include "framework/contracts/log.h"

namespace VespKeelgateService {

CommandType checkCommand(const VespClientMessageContext& context) {
  const Optional<CommandType> command = CommandType::fromRawValue(context.command);
  if (command) return *command;
  Keelgate::Log::keelgate.error("Invalid command ID %@",
                                Keelgate::rendered(Optional<UInt64>(context.command)));
  // Logged first: the one line of the program, and a number is all that stands in it.
  throw Keelgate::Breach("com.tessen.Keelgate.VespServiceUnpacker",
                         "Invalid command ID " + std::to_string(context.command));
}

}  // namespace VespKeelgateService
