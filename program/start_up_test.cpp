// SPDX-License-Identifier: Apache-2.0
// The service's start-up against a framework of the test's own, which writes down every call.
#include "program/service/start_up.h"
#include "framework/contracts/process.h"
#include "framework/server/keelgate_server.h"
#include "program/service/vesp_client_message_unpacker.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace {

std::vector<std::string> calls;

}  // namespace

namespace Keelgate {

void register_for_dlsym_callbacks() noexcept {
  calls.emplace_back("dlsym callbacks");
}
void Preferences::setDirectMode(int on) noexcept {
  calls.push_back("direct " + std::to_string(on));
}
void Preferences::setReadOnly(int on) noexcept {
  calls.push_back("read-only " + std::to_string(on));
}

KeelgateServer& KeelgateServer::service() {
  static KeelgateServer server;
  calls.emplace_back("server");
  return server;
}

// A contextual handler goes by the context: it knows the service of an unknown one.
void KeelgateServer::add(std::size_t record, Handler handler) {
  std::string kind = "message";
  try {
    handler({.record = record, .message = {}, .command = 1, .service = "nobody"});
  } catch (const VespKeelgateService::VespClientMessageUnpackingError& error) {
    kind = "contextual, " + *error.service;
  } catch (const DecodingError&) {
    kind = "message";
  }
  calls.push_back("register " + std::to_string(record) + " " + kind);
}

void KeelgateServer::resume(Optional<SandboxID> sandboxID) {
  calls.emplace_back(sandboxID == SandboxID::keelgate ? "resume keelgate" : "resume");
}

}  // namespace Keelgate

namespace VespKeelgateService {

TEST(StartUp, RunsInExactlyThisOrder) {
  EXPECT_EQ(startUp(), 0);
  EXPECT_EQ(calls, (std::vector<std::string>{"dlsym callbacks", "direct 1", "read-only 1", "server",
                                             "register 0 message", "register 1 message",
                                             "register 2 message", "register 3 message",
                                             "register 4 contextual, nobody", "resume keelgate"}));
}

struct Unpacker {
  using SchemaType = VespClientMessageResult;
  using Context = VespClientMessageContext;
  using Commands = Keelgate::TypeList<>;
  VespClientMessageResult unpack(Bytes, const Context&) const { return {}; }
};

TEST(StartUpDeathTest, TheSameServiceTwiceEndsTheProcess) {
  using Twice = Keelgate::TypeList<Service<"a", Unpacker>, Service<"a", Unpacker>>;
  EXPECT_DEATH(ServiceToUnpackerMap{Twice()}, "");
}

}  // namespace VespKeelgateService
