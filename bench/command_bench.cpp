// SPDX-License-Identifier: Apache-2.0
// What `keelgate stream` does for a message itself: a line of input read, and a record written as a
// reply; without the client and the service, which host_bench measures.
#include "cli/request_line.h"
#include "framework/json/values.h"
#include "plist/writer.h"
#include "program/payload/vesp_ostrel_payload_unpacker.h"
#include "text/base64.h"

#include <benchmark/benchmark.h>

#include <string>

namespace Keelgate::CLI {
namespace {

using ::PropertyList::Data;
using ::PropertyList::Dictionary;

/// A push payload of 2,136 bytes with payloads in it.
Keelgate::Data message() {
  const Dictionary inner{{"c", 102}, {"P", Data(320, std::byte{1})}, {"htu", true}};
  return ::PropertyList::writeBinary(Dictionary{{"c", 100},
                                                {"v", 8},
                                                {"P", Data(1220, std::byte{0xa5})},
                                                {"i", "42"},
                                                {"E", "pair"},
                                                {"qI", "queue-1"},
                                                {"tP", "mailto:ada@example.org"},
                                                {"sP", "tel:+15550100"},
                                                {"e", 1795255200},
                                                {"mml", ::PropertyList::Array{inner, inner}}});
}

void readLine(benchmark::State& state) {
  const std::string line = R"({"record": "PulseUserPayload", "message": ")" +
                           Text::encodeBase64(message()) + R"(", "id": 12345})";
  for (auto _ : state) {
    // A line is decoded in its own memory.
    std::string copy = line;
    benchmark::DoNotOptimize(readRequestLine(copy));
  }
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(line.size()));
}
BENCHMARK(readLine);

void writeReply(benchmark::State& state) {
  const auto record = VespKeelgateService::VespOstrelPayloadUnpacker().unpack(message());
  std::size_t size = 0;
  for (auto _ : state) {
    JSON::Writer out(JSON::Layout::compact);
    JSON::write(out, record);
    size = JSON::sizeOf(std::move(out).take());
  }
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(size));
}
BENCHMARK(writeReply);

}  // namespace
}  // namespace Keelgate::CLI

BENCHMARK_MAIN();
