// SPDX-License-Identifier: Apache-2.0
/// What travels between the client and the service: two kinds of channel, one dispatch table each.
///
/// *Control* (client <-> zygote, SOCK_SEQPACKET): fixed ControlFrames, one per packet.
///
///     client                          zygote
///     hello{options}            ->
///                               <-    ready{layers}            or refused{step} and it exits
///     fork{slot, length} + descriptor ->                       a worker on that descriptor
///     kill{slot}                ->                             SIGKILL for that slot's worker
///                               <-    exit{slot, status, ...}  exactly one for every fork
///
/// A slot is any number that no living worker has; it is free again with its exit. A kill for a
/// slot without a worker is ignored: the worker may have ended meanwhile.
///
/// *Data* (client <-> one worker, SOCK_STREAM): a RequestHeader with the service identifier and the
/// message behind it; then at most `maximumLogFrames` log frames and exactly one record or error
/// frame, each a ReplyHeader with its body behind it. To a worker that is used again requests may
/// follow each other at once; replies come in the same order, and none before its request is whole.
///
/// Both sides are of one build on one machine, so integers are in the machine's own order, and a
/// frame that is not exactly right is fatal. The client trusts no reply: a worker may be taken
/// over. control_frames.h and data_frames.h are the only places that write and check them.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace Keelgate::Protocol {

/// "KGAT". Nothing is looked at in a frame that begins otherwise.
constexpr std::uint32_t magic = 0x4b47'4154;
/// To be raised with any change of what travels: two builds that differ must refuse each other.
constexpr std::uint16_t protocolVersion = 8;

/// From 1, here and below, so that a frame of zeros is not one.
enum class ControlKind : std::uint16_t { hello = 1, ready, fork, kill, exit, refused };

/// What stands in `numbers` for each kind, all others being 0:
///   hello: [0] messages per worker, [1] CPU seconds per worker,
///          [2] 1 where each worker is to be forked
///   ready: [0] layers (Layer), [1] version of the service: 16 bits each for major, minor, patch
///   fork:  [0] length in bytes of the longest message that the worker will be given
///   exit:  [0] wait status as wait4 gives it, [1] peak resident bytes, [2] CPU microseconds;
///          [3] 1 for a worker that could not be forked, and so has read nothing
///   refused: [0] StartStep, [1] errno or 0
struct ControlFrame {
  std::uint32_t magic;
  std::uint16_t version;
  ControlKind kind;
  /// Of fork, kill and exit; 0 in the others.
  std::uint32_t slot;
  /// Always 0, as below.
  std::uint32_t reserved;
  std::array<std::uint64_t, 4> numbers;
};
// No padding in any of the three: they are sent as they lie in memory, and a gap would carry what
// was there before.
static_assert(sizeof(ControlFrame) == 48);

/// Stands before every request on a data channel. Written by the client, which is trusted; the
/// bytes that follow it are not.
struct RequestHeader {
  std::uint32_t magic;
  std::uint16_t version;
  /// recordNumber<Record> of the record that is asked for.
  std::uint16_t record;
  /// Counts the requests of a worker from 0; the reply repeats it.
  std::uint32_t sequence;
  /// In bytes; the identifier comes first behind the header, then the body.
  std::uint32_t serviceLength;
  std::uint64_t bodyLength;
  std::uint64_t command;
};
static_assert(sizeof(RequestHeader) == 32);

/// Frames of `log` come first; one of the others is the last.
enum class ReplyKind : std::uint16_t { log = 1, record, error };

/// Stands before every frame that a worker sends. It may be taken over by then: none of these
/// has to be true.
struct ReplyHeader {
  std::uint32_t magic;
  std::uint16_t version;
  ReplyKind kind;
  std::uint32_t sequence;
  /// 1 where the worker ends after this reply, otherwise 0: another number would be a second
  /// spelling of one frame.
  std::uint32_t last;
  std::uint64_t bodyLength;
};
static_assert(sizeof(ReplyHeader) == 24);

/// One log line is all that the program ever writes for a message; a few more are harmless, a
/// stream of them is an attack on the log.
constexpr std::size_t maximumLogFrames = 8;
constexpr std::size_t maximumLogLength = 512;

/// A topic identifier has some forty characters; this bounds what a caller can make us copy.
constexpr std::size_t maximumServiceLength = std::size_t{64} * 1024;

/// The exit status of a worker whose heap did not suffice. This and the next two are those that
/// sysexits.h has for a passing failure, a breach of protocol and a lack of permission.
constexpr int resourceExitStatus = 75;

/// The exit status of a worker that was sent a frame which is not exactly right.
constexpr int protocolExitStatus = 76;

/// The exit status of a service that refused to start.
constexpr int refusedExitStatus = 77;

}  // namespace Keelgate::Protocol
