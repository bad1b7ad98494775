// SPDX-License-Identifier: Apache-2.0
/// From a fork to its exit: seal, then header, body, answer for each message. There is no other
/// state, and no way back into the zygote.
#include "framework/server/worker.h"

#include "framework/contracts/memory_budget.h"
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/protocol/data_frames.h"
#include "framework/sandbox/seal.h"
#include "framework/server/message_memory.h"

#include <unistd.h>
#include <algorithm>
#include <memory>
#include <new>

namespace Keelgate {

namespace {

using Protocol::ReplyKind;
using Protocol::RequestHeader;

/// The next request's header. The process ends where there is none; a wrong one comes from a client
/// of another build, which must not get an answer that it misreads.
RequestHeader receiveHeader(std::uint32_t sequence, std::uint64_t longestMessage) {
  RequestHeader header;
  const auto bytes = std::as_writable_bytes(std::span(&header, 1));
  if (!Protocol::readAll(serviceDescriptor, bytes)) _exit(0);
  // A message that is longer than the heap was fixed for would end for want of memory.
  if (!Protocol::isExpected(header, sequence, longestMessage)) {
    _exit(Protocol::protocolExitStatus);
  }
  return header;
}

/// Smaller bodies are sent together with their header: a write costs more than a copy.
constexpr std::size_t copiedBody = 64 * 1024;

/// False when the client has gone.
bool send(const Reply& reply, std::uint32_t sequence, bool last) {
  Data frames;
  std::size_t lines = 0;
  // Cut here so that an honest worker keeps within what its client will take.
  for (const String& line : reply.log) {
    if (++lines > Protocol::maximumLogFrames) break;
    const Bytes bytes = std::as_bytes(std::span(line));
    Protocol::appendReplyFrame(frames, sequence, ReplyKind::log,
                               bytes.first(std::min(bytes.size(), Protocol::maximumLogLength)));
  }
  if (reply.body.size() <= copiedBody) {
    Protocol::appendReplyFrame(frames, sequence, reply.kind, reply.body, last);
    return Protocol::writeAll(serviceDescriptor, frames);
  }
  const auto header = Protocol::makeReplyHeader(sequence, reply.kind, reply.body.size(), last);
  return Protocol::writeAll(serviceDescriptor, frames) &&
         Protocol::writeAll(serviceDescriptor, std::as_bytes(std::span(&header, 1))) &&
         Protocol::writeAll(serviceDescriptor, reply.body);
}

/// From the first byte of the body on, this is the part that a stranger may take over. False when
/// the worker has nothing more to give: a process cannot give back memory under its filter, so one
/// that has taken more than any short message may ends.
bool answer(const KeelgateServer& server, const RequestHeader& header) {
  MessageMemory::begin(allocationLimit(header.bodyLength));
  const std::size_t size = header.serviceLength + header.bodyLength;
  // One piece for both, so one allocation and one read; not zeroed, because it is filled at once.
  const auto bytes = std::make_unique_for_overwrite<std::byte[]>(size);
  if (!Protocol::readAll(serviceDescriptor, {bytes.get(), size})) _exit(0);
  const Reply reply = server.answer(
      {.record = header.record,
       .message = {bytes.get() + header.serviceLength, header.bodyLength},
       .command = header.command,
       .service = {reinterpret_cast<const char*>(bytes.get()), header.serviceLength}});
  const bool last = MessageMemory::peak() > allocationLimit(0);
  if (!send(reply, header.sequence, last)) _exit(0);
  return !last;
}

}  // namespace

void work(const KeelgateServer& server, std::uint64_t messages,
          const Sandbox::WorkerSeal& seal) try {
  Sandbox::sealWorker(seal);
  for (std::uint32_t sequence = 0; sequence != messages; ++sequence) {
    if (!answer(server, receiveHeader(sequence, seal.longestMessage))) break;
  }
  _exit(0);
} catch (const std::bad_alloc&) {
  // At once: whatever would run at an orderly exit wants memory, and calls that are forbidden.
  _exit(Protocol::resourceExitStatus);
} catch (const StartError&) {
  _exit(Protocol::refusedExitStatus);
}

}  // namespace Keelgate
