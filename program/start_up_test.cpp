// SPDX-License-Identifier: Apache-2.0
// The service's start-up against a server of the test's own, which writes down every call.
#include "program/service/start_up.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace {

std::vector<std::string> calls;

}  // namespace

// In place of the framework's own, which are process-wide.
void Keelgate::register_for_dlsym_callbacks() noexcept {
  calls.emplace_back("dlsym callbacks");
}
void Keelgate::Preferences::setDirectMode(int on) noexcept {
  calls.push_back("direct " + std::to_string(on));
}
void Keelgate::Preferences::setReadOnly(int on) noexcept {
  calls.push_back("read-only " + std::to_string(on));
}

namespace VespKeelgateService {

namespace {

class Server {
 public:
  static Server& service() {
    static Server server;
    calls.emplace_back("server");
    return server;
  }

  template <class R, Keelgate::MessageUnpacker U>
  void registerUnpacker(U) {
    static_assert(std::same_as<typename U::SchemaType, R>);
    calls.push_back(std::string(Keelgate::typeName<U>()) + " for " +
                    std::string(Keelgate::typeName<R>()));
  }
  template <class R, Keelgate::ContextualUnpacker U>
  void registerUnpacker(const U& unpacker) {
    try {
      unpacker.unpack({}, {.command = 1, .service = "nobody"});
    } catch (const VespClientMessageUnpackingError& error) {
      calls.push_back(std::string(Keelgate::typeName<U>()) + " without a service " +
                      *error.service);
    }
  }

  void resume(Optional<Keelgate::SandboxID> sandboxID) {
    calls.emplace_back(sandboxID == Keelgate::SandboxID::keelgate ? "resume keelgate" : "resume");
  }
};

TEST(StartUp, RunsInExactlyThisOrder) {
  EXPECT_EQ(startUp<Server>(), 0);
  EXPECT_EQ(calls, (std::vector<std::string>{
                       "dlsym callbacks", "direct 1", "read-only 1", "server",
                       "VespOstrelPayloadUnpacker for PulseUserPayload",
                       "VespCommandResponseUnpacker for VespCommandResponse",
                       "VespCommandWebTunnelResponseUnpacker for VespCommandWebTunnelResponse",
                       "VespInvitationUnpacker for VespInvitation",
                       "PropertyListUnpacker for PropertyList",
                       "VespClientMessageUnpacker without a service nobody", "resume keelgate"}));
}

struct Unpacker {
  using SchemaType = VespClientMessageResult;
  using Context = VespClientMessageContext;
  using Commands = Keelgate::TypeList<>;
  VespClientMessageResult unpack(Bytes, const Context&) const { return {}; }
};

TEST(StartUpDeathTest, TheSameServiceTwiceEndsTheProcess) {
  using Twice = Keelgate::TypeList<Service<"a", Unpacker>, Service<"a", Unpacker>>;
  EXPECT_DEATH(VespClientMessageUnpacker{Twice()}, "");
}

}  // namespace

}  // namespace VespKeelgateService
