// SPDX-License-Identifier: Apache-2.0
/// Hands untrusted messages to a sandboxed service and gets typed records back.
///
///     Keelgate::Client client;
///     auto payload = client.unpack<Keelgate::PulseUserPayload>(bytes);
///     auto result  = client.unpackClientMessage(
///         bytes, {.command = 232, .service = "com.tessen.private.braid.viso.video"});
///
/// No byte of a message is parsed in the calling process. By default every message gets a sealed
/// process that has seen no other message.
#pragma once

#include <keelgate/errors.h>
#include <keelgate/export.h>
#include <keelgate/records.h>
#include <keelgate/values.h>

#include <chrono>
#include <concepts>
#include <cstddef>
#include <exception>
#include <functional>
#include <memory>
#include <span>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace Keelgate {

/// One of the layers of isolation around the service's processes.
struct SandboxLayer {
  /// For people to read, e.g. "empty root directory".
  String name;
  /// False where the kernel, a container's profile or the caller's rights do not allow it.
  Bool present;
};

/// What the running service reports about itself.
struct ServiceReport {
  /// The version of this build: client and service are always of the same one.
  String version;
  /// Strongest first. Those that a service never starts without are listed too.
  Array<SandboxLayer> layers;
};

/// The outcomes of all messages of a client so far, by whatever call they came. `messages` is the
/// sum of the others.
struct Statistics {
  UInt64 messages;
  UInt64 records;
  /// Messages that an unpacker rejected, with any error.
  UInt64 rejections;
  /// One for each HostError::Reason.
  UInt64 crashed;
  UInt64 timedOut;
  UInt64 messageTooLarge;
  UInt64 resourcesExhausted;
  UInt64 protocolViolations;
  UInt64 startFailed;
};

/// The outcome of one message: the record, or the error that a call for it alone would have thrown.
template <OutputRecord R>
class Outcome {
 public:
  explicit Outcome(R record) : value_(std::move(record)) {}
  explicit Outcome(std::exception_ptr error) : value_(std::move(error)) {}

  [[nodiscard]] bool hasRecord() const noexcept { return value_.index() == 0; }
  /// The record, owned by this; throws the error if there is none. For one thread at a time.
  R& record() {
    if (!hasRecord()) std::rethrow_exception(std::get<1>(value_));
    return std::get<0>(value_);
  }

 private:
  std::variant<R, std::exception_ptr> value_;
};

namespace Detail {

/// Receives the outcome of one message, so that the library needs no templates.
class Sink {
 public:
  virtual ~Sink() = default;
  /// Room for the record that recordNumber stands for.
  virtual void* makeRecord() = 0;
  /// Called once, at the end, with null if there is a record.
  virtual void complete(std::exception_ptr error) = 0;
};

template <OutputRecord R>
class RecordSink final : public Sink {
 public:
  explicit RecordSink(std::function<void(Outcome<R>)> completion)
      : completion_(std::move(completion)) {}
  void* makeRecord() override { return &record_.emplace(); }
  void complete(std::exception_ptr error) override {
    completion_(error ? Outcome<R>(std::move(error)) : Outcome<R>(std::move(*record_)));
  }

 private:
  Optional<R> record_;
  std::function<void(Outcome<R>)> completion_;
};

}  // namespace Detail

/// A running service. All members may be called from many threads at once; each call holds one of
/// the service's processes, and waits for one while all are taken. The client makes no threads,
/// installs no signal handlers and leaves the application's children alone. In a fork of the
/// application it starts a service of its own at its first use; until then it keeps the parent's
/// channel open, so that the service of a killed parent ends only with the fork.
///
/// A calling thread needs 256 KiB of free stack; with less a call throws HostError
/// (resourcesExhausted).
///
/// A message that ends its process abnormally (it crashes, times out, exhausts its memory or
/// violates the protocol) also retires the service, whose address layout may now be known: a
/// standby takes its place, and the old one finishes its messages. After 10,000 messages or ten
/// minutes a service is replaced anyway.
///
/// A call returns nothing partial: it gives the whole record, or throws and leaves the client as it
/// was, ready for the next message.
class KEELGATE_API Client {
 public:
  /// How a message gets a process that has seen no other. `rewind` restores the memory and
  /// registers of a process that has answered to what they were before its first message; where the
  /// system cannot, and after anything unusual, it forks. `fork` always forks.
  enum class Isolation { rewind, fork };

  struct Options {
    /// Bounds the processes and descriptors that a client takes.
    static constexpr unsigned maximumProcesses = 128;
    /// Positions in a message are stored in 32 bits.
    static constexpr std::size_t maximumMessageSize = 0xffff'ffff;

    /// How many messages are processed at a time; 0 stands for the number of processors, and a
    /// number above `maximumProcesses` for that. Messages of 4 MiB and more get at most three
    /// quarters of the processes, but at least one.
    unsigned processes = 0;
    /// From the call until the record, including the wait for a free process; a message that takes
    /// longer is given up. It bounds the cost of a hostile message, so it cannot be switched off;
    /// more than a year counts as a year.
    std::chrono::milliseconds timeLimit{5000};
    /// In bytes, at most `maximumMessageSize`. Checked before anything is sent, so a longer
    /// message costs nothing.
    std::size_t largestMessage = std::size_t{64} << 20;
    /// How many messages a process may see before a fresh one takes its place. With 1, a process
    /// that was taken over by a message never sees another sender's message. A process that is used
    /// again may fill a heap in proportion to `largestMessage`, however short its messages are. 0
    /// counts as 1.
    std::size_t messagesPerProcess = 1;
    /// With more abnormal ends a second than this, their errors are delayed, though not beyond the
    /// time limit. That slows down an attacker who searches for an address or keeps services
    /// restarting, and nobody else. A burst of four is not delayed; 0 disables the delay.
    unsigned abnormalEndsPerSecond = 10;
    /// Refuse to run where namespaces or Landlock are missing. Without it, missing layers are
    /// logged in one line, once for each client.
    bool requireLayers = false;
    /// The path of the VespKeelgateService to start; by default the one beside this library. Its
    /// file and all folders above must belong to root or the caller and be writable by nobody else.
    String servicePath;
    /// The path of an activated service's socket. If it is set, no service is started, and
    /// `servicePath` is not used.
    String socket;
    /// A user id that may listen on the socket, besides root (as a service manager does) and the
    /// caller's own user.
    Optional<unsigned> socketUser;
    /// Called with each log line, control characters escaped; by default lines go to standard
    /// error. It is called by threads that are in a call to the client, by several at once too. It
    /// must not throw or call the client.
    std::function<void(std::string_view line)> log;
    /// Has an effect only with `messagesPerProcess` 1.
    Isolation isolation = Isolation::rewind;
  };

  /// A message for a batch or an asynchronous call. The bytes are borrowed until its outcome is
  /// delivered.
  struct Request {
    Bytes message;
    /// Used for VespClientMessageResult only.
    VespClientMessageContext context{.command = 0, .service = {}};
  };

  /// Starts the service, which has 10 s to get ready. Throws HostError (startFailed) with a
  /// sentence that says what to do about it.
  Client();
  explicit Client(Options options);
  /// Ends the service within 200 ms; what still runs after 100 ms is killed. No call may be under
  /// way. In a fork of the application it closes the fork's descriptors and leaves the parent's
  /// service alone.
  ~Client();
  /// A moved-from client can only be destroyed or assigned to.
  Client(Client&&) noexcept;
  Client& operator=(Client&&) noexcept;

  /// The record that a message holds. Throws what the unpacker threw (DecodingError, Breach), or
  /// HostError. The bytes are borrowed during the call. The record owns all that it holds, and is
  /// still untrusted: its form has been checked, its meaning has not.
  template <OutputRecord R>
  requires(!std::same_as<R, VespClientMessageResult>) R unpack(Bytes message) {
    R record{};
    unpackInto(recordNumber<R>, {.message = message}, &record);
    return record;
  }

  /// The same for a client message, which comes with the command and the service that it arrived
  /// under. Also throws VespClientMessageUnpackingError; and HostError (messageTooLarge) for a
  /// service identifier of more than 64 KiB.
  VespClientMessageResult unpackClientMessage(Bytes message,
                                              const VespClientMessageContext& context) {
    VespClientMessageResult record{};
    unpackInto(recordNumber<VespClientMessageResult>, {.message = message, .context = context},
               &record);
    return record;
  }

  /// Unpacks many messages in one call, as many at a time as there are processes; the calling
  /// thread drives them all. The time limit of each message starts when its processing does.
  /// `visitor` is called with each position and its outcome, in order of completion. An exception
  /// from it ends the batch and propagates; messages in progress are given up.
  template <OutputRecord R>
  void unpackBatch(std::span<const Request> requests,
                   const std::function<void(std::size_t position, Outcome<R> outcome)>& visitor) {
    runBatch(recordNumber<R>, requests, [&](std::size_t position) {
      return std::make_unique<Detail::RecordSink<R>>(
          [&visitor, position](Outcome<R> outcome) { visitor(position, std::move(outcome)); });
    });
  }
  /// The same; returns the outcomes in the order of the requests.
  template <OutputRecord R>
  std::vector<Outcome<R>> unpackBatch(std::span<const Request> requests) {
    std::vector<Outcome<R>> outcomes(requests.size(), Outcome<R>(std::exception_ptr()));
    unpackBatch<R>(requests, [&](std::size_t position, Outcome<R> outcome) {
      outcomes[position] = std::move(outcome);
    });
    return outcomes;
  }

  /// Starts to unpack a message. dispatch() calls `completion` once, with the outcome, within
  /// `timeLimit` from now (by default that of the options) if the application dispatches in time.
  /// The completion may call the client. Throws HostError (startFailed) when there are no
  /// descriptors left.
  template <OutputRecord R>
  // NOLINTNEXTLINE(performance-unnecessary-value-param): it is moved on, unseen in a template.
  void start(Request request, std::function<void(Outcome<R> outcome)> completion,
             Optional<std::chrono::milliseconds> timeLimit = std::nullopt) {
    startTask(recordNumber<R>, std::move(request),
              std::make_unique<Detail::RecordSink<R>>(std::move(completion)), timeLimit);
  }
  /// For an event loop: readable (poll, epoll) when dispatch() has something to do. The client owns
  /// it. A fork of the application has another one, and the parent's messages are not completed
  /// there. Throws as start() does.
  int descriptor();
  /// Advances all started messages without waiting, and calls completions. An exception from a
  /// completion propagates; the next dispatch() calls the remaining ones. While one thread is in
  /// dispatch(), it returns at once in the others. Messages in progress when the client is
  /// destroyed are given up, and their completions are never called.
  void dispatch();

  [[nodiscard]] Statistics statistics() const noexcept;

  /// The version and layers of the service. Throws HostError when none runs or can be started.
  ServiceReport report();

 private:
  class Implementation;
  using MakeSink = std::function<std::unique_ptr<Detail::Sink>(std::size_t position)>;

  // Defined in the library: no application compiles the reader of replies.
  void unpackInto(std::size_t recordNumber, Request request, void* record);
  void runBatch(std::size_t recordNumber, std::span<const Request> requests,
                const MakeSink& makeSink);
  void startTask(std::size_t recordNumber, Request request, std::unique_ptr<Detail::Sink> sink,
                 Optional<std::chrono::milliseconds> timeLimit);

  std::unique_ptr<Implementation> implementation_;
};

}  // namespace Keelgate
