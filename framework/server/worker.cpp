// SPDX-License-Identifier: Apache-2.0
/// From a fork to its exit: seal, then header, body, answer for each message. There is no other
/// state, and no way back into the zygote.
#include "framework/server/worker.h"

#include "framework/sandbox/refusal.h"
#include "framework/sandbox/seal.h"
#include "framework/server/channel.h"

#include <unistd.h>
#include <algorithm>
#include <cstring>
#include <memory>
#include <new>

namespace Keelgate {

namespace {

using Transport::ReplyHeader;
using Transport::ReplyKind;
using Transport::RequestHeader;

/// The next request's header. The process ends where there is none; a wrong one comes from a client
/// of another build, which must not get an answer that it misreads.
RequestHeader receiveHeader(const WorkerOptions& options, std::uint32_t sequence) {
  RequestHeader header;
  if (!receiveAll(std::as_writable_bytes(std::span(&header, 1)))) _exit(0);
  if (header.magic != Transport::magic || header.version != Transport::protocolVersion ||
      header.sequence != sequence || header.serviceLength > Transport::maximumServiceLength ||
      // The heap was fixed for messages up to that length; a longer one would end for want of
      // memory.
      header.bodyLength > options.longestMessage) {
    _exit(Transport::protocolExitStatus);
  }
  return header;
}

void append(Data& frames, std::uint32_t sequence, ReplyKind kind, Bytes body) {
  const ReplyHeader header{.magic = Transport::magic,
                           .version = Transport::protocolVersion,
                           .kind = kind,
                           .sequence = sequence,
                           .reserved = 0,
                           .bodyLength = body.size()};
  const Bytes headerBytes = std::as_bytes(std::span(&header, 1));
  frames.insert(frames.end(), headerBytes.begin(), headerBytes.end());
  frames.insert(frames.end(), body.begin(), body.end());
}

/// All frames of a reply in one piece, so that most replies are one write.
Data frame(const Reply& reply, std::uint32_t sequence) {
  Data frames;
  std::size_t lines = 0;
  // Cut here so that an honest worker keeps within what its client will take.
  for (const String& line : reply.log) {
    if (++lines > Transport::maximumLogFrames) break;
    append(
        frames, sequence, ReplyKind::log,
        std::as_bytes(std::span(line)).first(std::min(line.size(), Transport::maximumLogLength)));
  }
  frames.reserve(frames.size() + sizeof(ReplyHeader) + reply.body.size());
  append(frames, sequence, reply.kind, reply.body);
  return frames;
}

/// From the first byte of the body on, this is the part that a stranger may take over.
void answer(const KeelgateServer& server, const RequestHeader& header) {
  const std::size_t size = header.serviceLength + header.bodyLength;
  // One piece for both, so one allocation and one read; not zeroed, because it is filled at once.
  const auto bytes = std::make_unique_for_overwrite<std::byte[]>(size);
  if (!receiveAll({bytes.get(), size})) _exit(0);
  const Reply reply = server.answer(
      {.record = header.record,
       .message = {bytes.get() + header.serviceLength, header.bodyLength},
       .command = header.command,
       .service = {reinterpret_cast<const char*>(bytes.get()), header.serviceLength}});
  if (!sendAll(frame(reply, header.sequence))) _exit(0);
}

}  // namespace

void work(const KeelgateServer& server, const WorkerOptions& options, int channel) try {
  Sandbox::sealWorker({.channel = channel,
                       .parent = options.parent,
                       .cpuSeconds = options.cpuSeconds,
                       .longestMessage = options.longestMessage,
                       .filter = options.filter});
  for (std::uint32_t sequence = 0; sequence != options.messages; ++sequence) {
    answer(server, receiveHeader(options, sequence));
  }
  _exit(0);
} catch (const std::bad_alloc&) {
  // At once: whatever would run at an orderly exit wants memory, and calls that are forbidden.
  _exit(Transport::resourceExitStatus);
} catch (const Sandbox::Refusal&) {
  _exit(Transport::refusedExitStatus);
}

}  // namespace Keelgate
