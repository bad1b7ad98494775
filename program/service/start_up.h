// SPDX-License-Identifier: Apache-2.0
/// The entry, apart from main() so that a test can run it with a server of its own. For the main
/// thread, once. The order is the point of it: what the process may no longer do comes before what
/// it will.
#pragma once

#include "framework/contracts/process.h"
#include "framework/server/keelgate_server.h"
#include "program/service/tables.h"
#include "program/service/vesp_client_message_unpacker.h"

#include <type_traits>

namespace VespKeelgateService {

/// The whole life of the service's process: prepares it, registers the unpackers and hands it over
/// to the server. Returns the exit status, if the server ever lets go of it.
template <class Server = Keelgate::KeelgateServer>
int startUp() {
  Keelgate::register_for_dlsym_callbacks();
  // Before the server is touched, and never undone.
  Keelgate::Preferences::setDirectMode(1);
  Keelgate::Preferences::setReadOnly(1);

  Server& server = Server::service();
  MessageUnpackers::each([&]<class U>(std::type_identity<U>) {
    server.template registerUnpacker<typename U::SchemaType>(U());
  });
  // Deliberate: the router comes last.
  server.template registerUnpacker<VespClientMessageResult>(VespClientMessageUnpacker(Services()));

  server.resume(Keelgate::SandboxID::keelgate);
  // Where there was no sandbox to serve in.
  return 0;
}

}  // namespace VespKeelgateService
