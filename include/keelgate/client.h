// SPDX-License-Identifier: Apache-2.0
/// Hands untrusted messages to a sandboxed service and gets typed records back.
///
///     Keelgate::Client client;
///     auto payload = client.unpack<Keelgate::PulseUserPayload>(bytes);
///     auto result  = client.unpackClientMessage(
///         bytes, {.command = 232, .service = "com.tessen.private.braid.viso.video"});
///
/// No byte of a message is parsed in the calling process. By default every message has a freshly
/// forked, sealed process to itself.
#pragma once

#include <keelgate/errors.h>
#include <keelgate/export.h>
#include <keelgate/records.h>
#include <keelgate/values.h>

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string_view>

namespace Keelgate {

/// One of the walls around the service's processes.
struct SandboxLayer {
  /// For people to read, e.g. "empty root directory".
  String name;
  /// False where the kernel, a container's profile or the caller's own rights took it away.
  Bool present;
};

/// What the running service said of itself.
struct ServiceReport {
  /// Of this build, which client and service always share.
  String version;
  /// Strongest first. Those that a service never starts without are listed too.
  Array<SandboxLayer> layers;
};

/// A running service. All members may be called from many threads at once; each call holds one of
/// the service's processes, and waits for one while all are taken. The client makes no threads,
/// installs no signal handlers and leaves the application's children alone. In a process that was
/// forked from the application it starts a service of its own at its first use; until then it
/// shares the parent's channel, so that a service whose parent was killed ends with it.
///
/// A call returns nothing partial: it gives the whole record, or throws and leaves the client as it
/// was, ready for the next message.
class KEELGATE_API Client {
 public:
  struct Options {
    /// Messages that can be in work at once, at most 128; 0 stands for one for each processor. A
    /// higher number is cut to the most, not refused.
    unsigned processes = 0;
    /// From the call until the record; a message that takes longer is given up. Waiting for a free
    /// process counts. It bounds what a hostile message can cost the caller, so there is no value
    /// for "none"; more than a year counts as a year.
    std::chrono::milliseconds timeLimit{5000};
    /// In bytes, at most 4 GiB - 1. Looked at before anything is sent, so a message above it costs
    /// nothing.
    std::size_t largestMessage = std::size_t{64} << 20;
    /// How many messages a process may see before a fresh one takes its place. With 1 a process
    /// that was taken over by a message never sees another sender's message. A process that is used
    /// again is forked for the largest message, whatever it gets, and so may fill a heap in
    /// proportion to `largestMessage`. 0 counts as 1.
    std::size_t messagesPerProcess = 1;
    /// Refuse to run where namespaces or Landlock are missing. Without it a missing wall is one
    /// line of the log, once for each client.
    bool requireLayers = false;
    /// The VespKeelgateService to start; empty: the one of the tree that this library is in. Its
    /// file and all folders above must belong to root or the caller and be writable by nobody else.
    String servicePath;
    /// The socket of an activated service, which is used in place of a started one. A path; it goes
    /// before `servicePath`.
    String socket;
    /// Takes each line that the service logs, control characters escaped, from any thread; by
    /// default they go to standard error. Several threads may be in it at once, each within a call
    /// to the client. It must not throw, and must not call the client back.
    std::function<void(std::string_view line)> log;
  };

  /// Starts the service, which has 10 s to get ready. Throws HostError (startFailed) with a
  /// sentence that says what to do about it.
  Client();
  explicit Client(Options options);
  /// Ends it, within 200 ms: after 100 ms whatever still runs is killed. No call may be under way.
  /// In a fork of the application it closes the fork's descriptors and lets the parent's service
  /// be.
  ~Client();
  Client(const Client&) = delete;
  Client& operator=(const Client&) = delete;

  /// The record that a message holds. Throws what the unpacker threw (DecodingError, Breach), or
  /// HostError. The bytes are borrowed for the time of the call. What comes back owns all that it
  /// holds, and is still untrusted: its form has been checked, its meaning has not.
  template <OutputRecord R>
  requires(!std::same_as<R, VespClientMessageResult>) R unpack(Bytes message);

  /// The same for a client message, which comes with the command and the service that it arrived
  /// under. Throws VespClientMessageUnpackingError too. The identifier may have 64 KiB; above that
  /// HostError (messageTooLarge).
  VespClientMessageResult unpackClientMessage(Bytes message,
                                              const VespClientMessageContext& context);

  /// Which walls the running service has. Throws HostError when none is running and none starts.
  ServiceReport report();

 private:
  class Implementation;
  std::unique_ptr<Implementation> implementation_;
};

// Defined and instantiated in the library: no application compiles the reader of replies.
extern template KEELGATE_API PulseUserPayload Client::unpack(Bytes);
extern template KEELGATE_API VespCommandResponse Client::unpack(Bytes);
extern template KEELGATE_API VespCommandWebTunnelResponse Client::unpack(Bytes);
extern template KEELGATE_API VespInvitation Client::unpack(Bytes);

}  // namespace Keelgate
