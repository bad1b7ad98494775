// SPDX-License-Identifier: Apache-2.0
// What an unpacker takes for a message, from bytes to record and on to the body of a reply; without
// processes and sockets, which host_bench measures. Run from the root of the tree.
#include "framework/transport/record_coding.h"
#include "program/service/tables.h"
#include "program/service/vesp_client_message_unpacker.h"

#include <benchmark/benchmark.h>

#include <cstring>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

namespace VespKeelgateService {

namespace {

std::vector<char> example(const std::string& name) {
  std::ifstream in("examples/messages/" + name, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), {}};
}

/// Runs the body on an example's bytes; beside the time, how fast memcpy moves the same bytes.
template <class Body>
void measure(benchmark::State& state, const std::string& name, Body body) {
  const std::vector<char> message = example(name);
  if (message.empty()) return state.SkipWithError("no such example; run from the root of the tree");
  const Bytes bytes = std::as_bytes(std::span(message));
  for (auto _ : state) benchmark::DoNotOptimize(body(bytes));
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(bytes.size()));
}

template <class Unpacker>
void registerRecord(const std::string& name) {
  for (const char* form : {".bplist", ".xml"}) {
    benchmark::RegisterBenchmark(
        ("unpack/" + name + form).c_str(), [file = name + form](benchmark::State& state) {
          measure(state, file, [](Bytes from) {
            return Keelgate::Transport::encodeRecord(Unpacker().unpack(from));
          });
        });
  }
}

void registerClientMessage(const std::string& name, const char* service, UInt64 command) {
  static const VespClientMessageUnpacker router((ServiceToUnpackerMap(Services())));
  for (const char* form : {".bplist", ".xml"}) {
    benchmark::RegisterBenchmark(
        ("unpack/" + name + form).c_str(), [=, file = name + form](benchmark::State& state) {
          measure(state, file, [&](Bytes from) {
            return Keelgate::Transport::encodeRecord(
                router.unpack(from, {.command = command, .service = service}));
          });
        });
  }
}

}  // namespace

}  // namespace VespKeelgateService

int main(int argc, char** argv) {
  using namespace VespKeelgateService;
  registerClientMessage("sample-message", "com.tessen.private.braid.rtcengine.rtctester", 1);
  registerClientMessage("session-invitation", "com.tessen.private.braid.viso.video", 232);
  registerClientMessage("check-in", "com.tessen.private.braid.waymark", 3);
  registerRecord<VespOstrelPayloadUnpacker>("push-payload");
  registerRecord<VespCommandResponseUnpacker>("command-response");
  registerRecord<VespInvitationUnpacker>("invitation-home");
  benchmark::Initialize(&argc, argv);
  benchmark::RunSpecifiedBenchmarks();
  return 0;
}
