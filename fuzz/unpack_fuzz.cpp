// SPDX-License-Identifier: Apache-2.0
/// The door of every unpacker, from a message's bytes to its JSON. The first byte says where the
/// message is sent.
#include "fuzz/messages/round_trip.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace Keelgate::Fuzz;
  if (size == 0) return 0;
  const Target& target = targets()[data[0] % targets().size()];
  read(target, replyTo(target, std::as_bytes(std::span(data, size)).subspan(1)));
  return 0;
}
