// SPDX-License-Identifier: Apache-2.0
/// The door that a taken-over worker has into the client: the body of a reply. The first byte says
/// what the client expects, a record by its number or an error. What is accepted is printed.
#include "framework/protocol/frames.h"
#include "fuzz/messages/round_trip.h"

#include "framework/transport/wire.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace Keelgate;
  if (size == 0) return 0;
  const std::size_t record = data[0];
  Reply reply{.kind = Protocol::ReplyKind::record, .body = {}, .log = {}};
  if (record >= OutputRecords::size) reply.kind = Protocol::ReplyKind::error;
  const Bytes body = std::as_bytes(std::span(data, size)).subspan(1);
  reply.body.bytes.assign(body.begin(), body.end());
  try {
    Fuzz::read({.record = record, .service = {}, .command = 0, .message = nullptr}, reply);
  } catch (const Transport::MalformedReply&) {
  }
  return 0;
}
