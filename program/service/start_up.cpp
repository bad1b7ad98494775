// SPDX-License-Identifier: Apache-2.0
/// The order is the point of this file: what the process may no longer do comes before what it
/// will.
#include "program/service/start_up.h"

#include "framework/contracts/process.h"
#include "framework/server/keelgate_server.h"
#include "program/service/tables.h"
#include "program/service/vesp_client_message_unpacker.h"

namespace VespKeelgateService {

namespace {

/// Written once, before there is anything to serve.
Keelgate::KeelgateServer* server = nullptr;

}  // namespace

int startUp() {
  Keelgate::register_for_dlsym_callbacks();
  // Before the server is touched, and never undone.
  Keelgate::Preferences::setDirectMode(1);
  Keelgate::Preferences::setReadOnly(1);

  server = &Keelgate::KeelgateServer::service();
  MessageUnpackers::each([]<class U>(std::type_identity<U>) {
    server->registerUnpacker<typename U::SchemaType>(U());
  });
  // Deliberate: the router comes last.
  server->registerUnpacker<VespClientMessageResult>(
      VespClientMessageUnpacker(ServiceToUnpackerMap(Services())));

  server->resume(Keelgate::SandboxID::keelgate);
  // Where there was no sandbox to serve in.
  return 0;
}

}  // namespace VespKeelgateService
