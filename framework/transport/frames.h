// SPDX-License-Identifier: Apache-2.0
/// What travels between the client and the service: two kinds of channel, one dispatch table each.
///
/// *Control* (client <-> zygote, SOCK_SEQPACKET): fixed ControlFrames, one per packet.
///
///     client                          zygote
///     hello{options}            ->
///                               <-    ready{layers}            or refused{obstacle} and it exits
///     fork{slot, length} + descriptor ->                       a worker on that descriptor
///     kill{slot}                ->                             SIGKILL for that slot's worker
///                               <-    killed{slot}           at once, where there was a worker
///                               <-    exit{slot, status, ...}  exactly one for every fork
///
/// A slot is any number that no living worker has; it is free again with its exit. A kill for a
/// slot without a worker is ignored: the worker may have ended meanwhile. A worker with gigabytes
/// to give back takes its time to end, and `killed` tells the client that its zygote is well
/// meanwhile.
///
/// *Data* (client <-> one worker, SOCK_STREAM, half-duplex, one request in flight): a RequestHeader
/// with the service identifier and the message behind it; then at most `maximumLogFrames` log
/// frames and exactly one record or error frame, each a ReplyHeader with its body behind it.
///
/// Both sides are of one build on one machine, so integers are in the machine's own order, and a
/// frame that is not exactly right is fatal. The client trusts no reply: a worker may be taken
/// over.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>

namespace Keelgate::Transport {

/// "KGAT". A frame that begins otherwise is no frame, and nothing of it is looked at.
constexpr std::uint32_t magic = 0x4b47'4154;
/// To be raised with any change of what travels: two builds that differ must refuse each other.
constexpr std::uint16_t protocolVersion = 3;

/// The channel's number in every process of the service. The first behind the standard ones, which
/// a service has not got.
constexpr int serviceDescriptor = 3;

/// From 1, here and below, so that a frame of zeros is none.
enum class ControlKind : std::uint16_t { hello = 1, ready, fork, kill, killed, exit, refused };

/// The walls around a worker. layers.h names them. A report is the sum of its bits.
enum Layer : std::uint32_t {
  /// The first walls: never missing in a service that said it was ready.
  layerStrictFilter = 1u << 0,
  layerOneDescriptor = 1u << 1,
  layerNoNewPrivileges = 1u << 2,
  layerNoCapabilities = 1u << 3,
  layerLimits = 1u << 4,
  layerNotDumpable = 1u << 5,
  /// The second walls: a machine may lack them.
  layerUserNamespace = 1u << 8,
  layerPidNamespace = 1u << 9,
  layerMountNamespace = 1u << 10,
  layerNetworkNamespace = 1u << 11,
  layerIpcNamespace = 1u << 12,
  layerUtsNamespace = 1u << 13,
  layerCgroupNamespace = 1u << 14,
  layerEmptyRoot = 1u << 15,
  layerLandlock = 1u << 16,
  layerNotRoot = 1u << 17,
  layerNoSupplementaryGroups = 1u << 18,
};

/// Why a service does not start. layers.h has the sentence for each.
enum class Obstacle : std::uint64_t {
  badFrame = 1,
  descriptors,
  process,
  watch,
  noNewPrivileges,
  capabilities,
  dumpable,
  limits,
  heap,
  filter,
  selfCheck,
  stack,
};

/// What stands in `numbers` for each kind, all others being 0:
///   hello: [0] messages per worker, [1] CPU seconds per worker
///   ready: [0] layers (Layer), [1] version of the service: 16 bits each for major, minor, patch
///   fork:  [0] length in bytes of the longest message that the worker will be given
///   exit:  [0] wait status as wait4 gives it, [1] peak resident bytes, [2] CPU microseconds;
///          [3] 1 for a worker that could not be forked, and so has read nothing
///   refused: [0] Obstacle, [1] errno or 0
struct ControlFrame {
  std::uint32_t magic;
  std::uint16_t version;
  ControlKind kind;
  /// Of fork, kill, killed and exit; 0 in the others.
  std::uint32_t slot;
  std::uint32_t reserved;
  std::uint64_t numbers[4];
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

/// Stands before every frame that a worker sends. It may be taken over by then: any of these may be
/// a lie.
struct ReplyHeader {
  std::uint32_t magic;
  std::uint16_t version;
  ReplyKind kind;
  std::uint32_t sequence;
  /// Always 0: another number would be a second spelling of one frame.
  std::uint32_t reserved;
  std::uint64_t bodyLength;
};
static_assert(sizeof(ReplyHeader) == 24);

/// One log line is all that the program ever writes for a message; a few more are harmless, a
/// stream of them is an attack on the log.
constexpr std::size_t maximumLogFrames = 8;
constexpr std::size_t maximumLogLength = 512;

/// A topic identifier has some forty characters; this bounds what a caller can make us copy.
constexpr std::size_t maximumServiceLength = std::size_t{64} * 1024;

/// Workers that are forked before their message is there are forked for messages up to this many
/// bytes. What is longer takes so long to read that the wait for a worker of its own is lost in it.
constexpr std::uint64_t shortMessage = std::uint64_t{256} << 10;

/// Address space that every worker has, whatever its message: the program's own needs and the
/// allocator's slack are far below. Untouched, it costs nothing.
constexpr std::size_t heapBase = std::size_t{128} << 20;

/// Address space for each byte of the message. The hungriest message is a list of empty payloads:
/// some 8 KB for the schema and the record of each, as against 45 bytes of XML or a dozen of
/// binary. A longer list than the base has room for, 16,000 at least and 26,000 in XML, would be no
/// push payload any more, and to grant its factor would let 64 MiB of message ask for the whole
/// machine.
constexpr std::size_t heapPerByte = 64;

/// Bytes of heap that a message of `length` bytes is worth. Short ones all get the same, which is
/// there in the zygote already. The client counts with it too: no honest worker can have made a
/// reply or a record that would not have fitted.
constexpr std::size_t heapFor(std::uint64_t length) {
  return heapBase + heapPerByte * static_cast<std::size_t>(std::max(length, shortMessage));
}

/// The exit status of a worker whose heap did not suffice. This and the next two are those that
/// sysexits.h has for a passing failure, a breach of protocol and a lack of permission.
constexpr int resourceExitStatus = 75;

/// The exit status of a worker that was sent a frame which is not exactly right.
constexpr int protocolExitStatus = 76;

/// The exit status of a service that refused to start.
constexpr int refusedExitStatus = 77;

}  // namespace Keelgate::Transport
