// SPDX-License-Identifier: Apache-2.0
/// Hands untrusted messages to a sandboxed service and gets typed records back.
///
///     Keelgate::Client client;
///     auto payload = client.unpack<Keelgate::PulseUserPayload>(bytes);
///     auto result  = client.unpackClientMessage(
///         bytes, {.command = 232, .service = "com.tessen.private.braid.viso.video"});
///
/// No byte of a message is parsed in the calling process. By default every message has a freshly
/// sealed process to itself.
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

/// What became of the messages of a client so far, by whatever call they came. `messages` is the
/// sum of the others.
struct Statistics {
  UInt64 messages;
  UInt64 records;
  /// Messages that an unpacker refused, with whatever error.
  UInt64 rejections;
  /// One for each HostError::Reason.
  UInt64 crashed;
  UInt64 timedOut;
  UInt64 messageTooLarge;
  UInt64 resourcesExhausted;
  UInt64 protocolViolations;
  UInt64 startFailed;
};

/// What became of one message: the record, or the error that a call for it alone would have thrown.
template <OutputRecord R>
class Outcome {
 public:
  explicit Outcome(R record) : value_(std::move(record)) {}
  explicit Outcome(std::exception_ptr error) : value_(std::move(error)) {}

  [[nodiscard]] bool hasRecord() const noexcept { return value_.index() == 0; }
  /// The record; throws the error where there is none.
  R& record() {
    if (!hasRecord()) std::rethrow_exception(std::get<1>(value_));
    return std::get<0>(value_);
  }

 private:
  std::variant<R, std::exception_ptr> value_;
};

namespace Detail {

/// Where the record of one message goes. It keeps the library free of what each record is made of.
class Sink {
 public:
  virtual ~Sink() = default;
  /// Room for the record that recordNumber stands for.
  virtual void* makeRecord() = 0;
  /// Once, at the end: null where there is a record.
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
/// installs no signal handlers and leaves the application's children alone. In a process that was
/// forked from the application it starts a service of its own at its first use; until then it
/// shares the parent's channel, so that a service whose parent was killed ends with it.
///
/// A calling thread needs 256 KiB of free stack; with less a call throws HostError
/// (resourcesExhausted).
///
/// A message that ends its process abnormally (it crashes, times out, exhausts its memory or
/// violates the protocol) also costs the service its address layout: another one, started in
/// advance, takes its place, and the old one finishes what it has. After 10,000 messages or ten
/// minutes a service is replaced anyway.
///
/// A call returns nothing partial: it gives the whole record, or throws and leaves the client as it
/// was, ready for the next message.
class KEELGATE_API Client {
 public:
  /// How a message gets a process that has seen no other. With `rewind` one that has answered is
  /// set back, its memory and registers, to before it read its first byte; where the machine does
  /// not give what that takes, and after anything unusual, it is a fork. With `fork` it always is.
  enum class Isolation { rewind, fork };

  struct Options {
    /// More could not be in work on any machine, and each costs a process or two.
    static constexpr unsigned mostProcesses = 128;
    /// Positions in a message are kept in 32 bits by whoever reads it.
    static constexpr std::size_t greatestLargestMessage = 0xffff'ffff;

    /// Messages that can be in work at once, at most `mostProcesses`; 0 stands for one for each
    /// processor. A higher number is cut to the most, not refused. Messages of 4 MiB and more get
    /// three quarters of them at most, so that small ones need not wait for large ones.
    unsigned processes = 0;
    /// From the call until the record; a message that takes longer is given up. Waiting for a free
    /// process counts. It bounds what a hostile message can cost the caller, so there is no value
    /// for "none"; more than a year counts as a year.
    std::chrono::milliseconds timeLimit{5000};
    /// In bytes, at most `greatestLargestMessage`. Looked at before anything is sent, so a message
    /// above it costs nothing.
    std::size_t largestMessage = std::size_t{64} << 20;
    /// How many messages a process may see before a fresh one takes its place. With 1 a process
    /// that was taken over by a message never sees another sender's message. A process that is used
    /// again is forked for the largest message, whatever it gets, and so may fill a heap in
    /// proportion to `largestMessage`. 0 counts as 1.
    std::size_t messagesPerProcess = 1;
    /// With more abnormal ends a second than this the error is given later, though not after the
    /// time limit: whoever searches for an address, or wants to keep services restarting, is slowed
    /// down, and nobody else is. Four at once are not; 0: none is.
    unsigned abnormalEndsPerSecond = 10;
    /// Refuse to run where namespaces or Landlock are missing. Without it a missing layer is one
    /// line of the log, once for each client.
    bool requireLayers = false;
    /// The VespKeelgateService to start; empty: the one of the tree that this library is in. Its
    /// file and all folders above must belong to root or the caller and be writable by nobody else.
    String servicePath;
    /// The socket of an activated service, which is used in place of a started one. A path; it goes
    /// before `servicePath`.
    String socket;
    /// The user id of whoever may listen on the socket, beside root, as which a service manager
    /// listens, and the caller's own user.
    Optional<unsigned> socketUser;
    /// Takes each line that the service logs, control characters escaped, from any thread; by
    /// default they go to standard error. Several threads may be in it at once, each within a call
    /// to the client. It must not throw, and must not call the client back.
    std::function<void(std::string_view line)> log;
    /// Of messages that have a process to themselves, with `messagesPerProcess` 1.
    Isolation isolation = Isolation::rewind;
  };

  /// A message as batches and asynchronous calls take it. The bytes are borrowed until its outcome
  /// is there.
  struct Request {
    Bytes message;
    /// For a VespClientMessageResult; the other records have none.
    VespClientMessageContext context{.command = 0, .service = {}};
  };

  /// Starts the service, which has 10 s to get ready. Throws HostError (startFailed) with a
  /// sentence that says what to do about it.
  Client();
  explicit Client(Options options);
  /// Ends it, within 200 ms: after 100 ms whatever still runs is killed. No call may be under way.
  /// In a fork of the application it closes the fork's descriptors and lets the parent's service
  /// be.
  ~Client();
  /// A client that was moved from can be destroyed and assigned to, and nothing else.
  Client(Client&&) noexcept;
  Client& operator=(Client&&) noexcept;

  /// The record that a message holds. Throws what the unpacker threw (DecodingError, Breach), or
  /// HostError. The bytes are borrowed for the time of the call. What comes back owns all that it
  /// holds, and is still untrusted: its form has been checked, its meaning has not.
  template <OutputRecord R>
  requires(!std::same_as<R, VespClientMessageResult>) R unpack(Bytes message) {
    R record{};
    unpackInto(recordNumber<R>, {.message = message}, &record);
    return record;
  }

  /// The same for a client message, which comes with the command and the service that it arrived
  /// under. Throws VespClientMessageUnpackingError too. The identifier may have 64 KiB; above that
  /// HostError (messageTooLarge).
  VespClientMessageResult unpackClientMessage(Bytes message,
                                              const VespClientMessageContext& context) {
    VespClientMessageResult record{};
    unpackInto(recordNumber<VespClientMessageResult>, {.message = message, .context = context},
               &record);
    return record;
  }

  /// Many messages in one call, as many of them at a time as there are processes; the calling
  /// thread drives them all. The time limit of each counts from when it has its turn. `visitor` is
  /// given each position and its outcome, as they come. What it throws ends the batch and comes
  /// through: messages that are in work are given up.
  template <OutputRecord R>
  void unpackBatch(std::span<const Request> requests,
                   const std::function<void(std::size_t position, Outcome<R> outcome)>& visitor) {
    runBatch(recordNumber<R>, requests, [&](std::size_t position) {
      return std::make_unique<Detail::RecordSink<R>>(
          [&visitor, position](Outcome<R> outcome) { visitor(position, std::move(outcome)); });
    });
  }
  /// The same with the outcomes in the order of the requests.
  template <OutputRecord R>
  std::vector<Outcome<R>> unpackBatch(std::span<const Request> requests) {
    std::vector<Outcome<R>> outcomes(requests.size(), Outcome<R>(std::exception_ptr()));
    unpackBatch<R>(requests, [&](std::size_t position, Outcome<R> outcome) {
      outcomes[position] = std::move(outcome);
    });
    return outcomes;
  }

  /// Begins with a message, and calls `completion` once, from dispatch(), with what became of it:
  /// within `timeLimit` from now, if the application dispatches; by default that of the options.
  /// The completion may call the client. Throws HostError (startFailed) when there are no
  /// descriptors left.
  template <OutputRecord R>
  // NOLINTNEXTLINE(performance-unnecessary-value-param): it is moved on, unseen in a template.
  void start(Request request, std::function<void(Outcome<R> outcome)> completion,
             Optional<std::chrono::milliseconds> timeLimit = std::nullopt) {
    startTask(recordNumber<R>, std::move(request),
              std::make_unique<Detail::RecordSink<R>>(std::move(completion)), timeLimit);
  }
  /// For an event loop: readable, as poll and epoll say it, when dispatch() has something to do.
  /// It stays the client's. In a fork of the application there is another one, and the parent's
  /// messages are not completed there.
  int descriptor();
  /// Goes on with all messages that were started, without waiting, and calls completions. What one
  /// throws comes through, and the next dispatch() calls the others. While a thread is in it others
  /// return at once. Messages that are in work when the client ends are given up, and their
  /// completions are not called.
  void dispatch();

  [[nodiscard]] Statistics statistics() const noexcept;

  /// Which layers the running service has. Throws HostError when none is running and none starts.
  ServiceReport report();

 private:
  class Implementation;
  class Message;
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
