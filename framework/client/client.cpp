// SPDX-License-Identifier: Apache-2.0
/// The public face: limits are checked, calls are driven, and a reply is turned into a record or
/// thrown.
#include <keelgate/client.h>

#include "framework/client/event_source.h"
#include "framework/client/stack.h"
#include "framework/contracts/layers.h"
#include "framework/contracts/memory_budget.h"
#include "framework/protocol/control_frames.h"
#include "framework/transport/error_coding.h"
#include "framework/transport/record_coding.h"
#include "text/utf8.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <mutex>

namespace Keelgate {

using Reason = HostError::Reason;
using std::chrono::milliseconds;
using VespKeelgateService::VespClientMessageUnpackingError;

namespace {

/// For the first start, when no message is waiting yet; a service has 10 s to get ready.
constexpr milliseconds firstStartPatience{10'100};

/// Reads the body of a record frame into a record that is there: a function for each output record.
using RecordReader = void (*)(Bytes body, const Transport::ReadLimits& limits, void* record);

constexpr auto recordReaders = [] {
  std::array<RecordReader, OutputRecords::size> readers{};
  OutputRecords::each([&]<class R>(std::type_identity<R>) {
    readers[recordNumber<R>] = [](Bytes body, const Transport::ReadLimits& limits, void* record) {
      *static_cast<R*>(record) = Transport::decodeRecord<R>(body, limits);
    };
  });
  return readers;
}();

void checkSize(const char* what, std::size_t size, std::size_t limit) {
  if (size <= limit) return;
  throw HostError(Reason::messageTooLarge, String(what) + " has " + std::to_string(size) +
                                               " bytes, and " + std::to_string(limit) +
                                               " are allowed");
}

/// Counts outcomes, from any thread.
class Counters {
 public:
  void noteRecord() noexcept { ++counts_[recordPlace]; }
  void noteError(const std::exception_ptr& error) noexcept {
    try {
      std::rethrow_exception(error);
    } catch (const HostError& host) {
      ++counts_[static_cast<std::size_t>(host.reason)];
    } catch (...) {
      ++counts_[rejectionPlace];
    }
  }

  [[nodiscard]] Statistics read() const noexcept {
    const auto of = [this](Reason reason) {
      return counts_[static_cast<std::size_t>(reason)].load();
    };
    Statistics all{.messages = 0,
                   .records = counts_[recordPlace],
                   .rejections = counts_[rejectionPlace],
                   .crashed = of(Reason::crashed),
                   .timedOut = of(Reason::timedOut),
                   .messageTooLarge = of(Reason::messageTooLarge),
                   .resourcesExhausted = of(Reason::resourcesExhausted),
                   .protocolViolations = of(Reason::protocolViolation),
                   .startFailed = of(Reason::startFailed)};
    all.messages = all.records + all.rejections + all.crashed + all.timedOut + all.messageTooLarge +
                   all.resourcesExhausted + all.protocolViolations + all.startFailed;
    return all;
  }

 private:
  /// Behind the reasons.
  static constexpr std::size_t recordPlace = static_cast<std::size_t>(Reason::startFailed) + 1;
  static constexpr std::size_t rejectionPlace = recordPlace + 1;
  std::array<std::atomic<UInt64>, rejectionPlace + 1> counts_{};
};

/// What a client has in one process.
struct Engine {
  explicit Engine(const Client::Options& options) : pool(options) {}

  EventSource& eventSource() {
    // Not std::call_once: where it throws, some implementations hang in the next call.
    const std::lock_guard lock(mutex);
    if (!events) events.emplace(pool);
    return *events;
  }

  Pool pool;
  std::mutex mutex;
  Optional<EventSource> events;
};

Client::Options bounded(Client::Options options) {
  options.largestMessage = std::min(options.largestMessage, Client::Options::maximumMessageSize);
  return options;
}

/// A record of the caller's, who waits for it.
class CallersRecord final : public Detail::Sink {
 public:
  explicit CallersRecord(void* record) : record_(record) {}
  void* makeRecord() override { return record_; }
  void complete(std::exception_ptr error) override {
    if (error) std::rethrow_exception(error);
  }

 private:
  void* record_;
};

}  // namespace

class Client::Implementation {
 public:
  explicit Implementation(Options itsOptions)
      : options(bounded(std::move(itsOptions))), engine_(new Engine(options)) {}

  ~Implementation() {
    Engine* engine = engine_.load();
    if (engine->pool.isOurs()) {
      delete engine;
    } else {
      engine->pool.abandon();
    }
  }
  Implementation(const Implementation&) = delete;
  Implementation& operator=(const Implementation&) = delete;

  /// That of this process. After a fork the inherited one belongs to the parent: its processes are
  /// no children of this one, and its locks may be held by threads that are not here. Several
  /// threads may find that out at a time; the first to have a new one wins.
  Engine& engine() {
    Engine* engine = engine_.load();
    if (engine->pool.isOurs()) return *engine;
    engine->pool.abandon();
    auto fresh = std::make_unique<Engine>(options);
    // Deliberate: the inherited one is never freed.
    if (engine_.compare_exchange_strong(engine, fresh.get())) return *fresh.release();
    return *engine;
  }

  const Options options;
  Counters counters;

 private:
  std::atomic<Engine*> engine_;
};

/// One message, by whatever call it came.
class Client::Message final : public Task {
 public:
  /// Without a deadline it has the time limit of the options from when it begins.
  Message(Implementation& client, std::size_t recordNumber, Request request,
          std::unique_ptr<Detail::Sink> sink, Deadline deadline)
      : client_(client),
        recordNumber_(recordNumber),
        request_(std::move(request)),
        sink_(std::move(sink)),
        deadline_(deadline) {}

  [[nodiscard]] bool isShared() const noexcept override {
    return !alone_ && request_.message.size() <= Pipeline::longest;
  }
  void goAlone() noexcept override { alone_ = true; }
  void beginTime() noexcept override {
    if (deadline_ == Deadline::max()) deadline_ = deadlineAfter(client_.options.timeLimit);
  }

  const OutgoingMessage* request() noexcept override {
    if (!sent_ && !error_) begin();
    if (!sent_) alone_ = true;
    return sent_ ? &*sent_ : nullptr;
  }

  bool take(const ReceivedReply& reply) noexcept override try {
    read(reply);
    return isInTime();
  } catch (const Transport::MalformedReply&) {
    return false;
  } catch (const Transport::ReadLimitReached&) {
    return false;
  } catch (const std::bad_alloc&) {
    return false;
  } catch (...) {
    error_ = std::current_exception();
    return isInTime();
  }

  Optional<Wait> advance() noexcept override {
    // First of all, so that nothing that follows goes uncounted.
    beginTime();
    const OutgoingMessage* const request = call_ || error_ ? nullptr : this->request();
    if (request != nullptr) call(*request);
    return call_ ? call_->advance() : std::nullopt;
  }

  void complete() override {
    if (call_) error_ = call_->error();
    if (error_) {
      client_.counters.noteError(error_);
    } else {
      client_.counters.noteRecord();
    }
    sink_->complete(std::move(error_));
  }

  [[nodiscard]] Deadline deadline() const noexcept override { return deadline_; }

 private:
  void begin() noexcept try {
    const auto& [command, service] = request_.context;
    requireStack();
    checkSize("the message", request_.message.size(), client_.options.largestMessage);
    checkSize("the service identifier", service.size(), Protocol::maximumServiceLength);
    // What is not UTF-8 could not travel, and the table of services has none such.
    if (!Text::isUtf8(service)) {
      throw VespClientMessageUnpackingError::noUnpackerForService(service);
    }
    sent_ = OutgoingMessage{.record = static_cast<std::uint16_t>(recordNumber_),
                            .command = command,
                            .service = service,
                            .message = request_.message};
  } catch (...) {
    error_ = std::current_exception();
  }

  void call(const OutgoingMessage& request) noexcept try {
    call_.emplace(client_.engine().pool, request, deadline_, alone_,
                  [this](const ReceivedReply& reply) { read(reply); });
  } catch (const std::bad_alloc&) {
    error_ = std::make_exception_ptr(
        HostError(Reason::resourcesExhausted, "this process has no memory for the message"));
  } catch (...) {
    error_ = std::current_exception();
  }

  /// A reply can be made to take long to read, too.
  bool isInTime() noexcept {
    if (Clock::now() < deadline_) return true;
    error_ = nullptr;
    return false;
  }

  void read(const ReceivedReply& reply) {
    const Transport::ReadLimits limits{.memory = memoryBudget(request_.message.size()),
                                       .deadline = deadline_};
    if (reply.kind == Protocol::ReplyKind::error) Transport::throwError(reply.body, limits);
    recordReaders.at(recordNumber_)(reply.body, limits, sink_->makeRecord());
  }

  Implementation& client_;
  const std::size_t recordNumber_;
  const Request request_;
  const std::unique_ptr<Detail::Sink> sink_;
  Deadline deadline_;
  /// From when it has begun.
  Optional<OutgoingMessage> sent_;
  /// It has shared a worker, and is not to again.
  bool alone_ = false;
  Optional<Call> call_;
  std::exception_ptr error_;
};

Client::Client() : Client(Options()) {}
Client::Client(Options options)
    : implementation_(std::make_unique<Implementation>(std::move(options))) {
  implementation_->engine().pool.start(deadlineAfter(firstStartPatience));
}
Client::~Client() = default;
Client::Client(Client&&) noexcept = default;
Client& Client::operator=(Client&&) noexcept = default;

void Client::unpackInto(std::size_t recordNumber, Request request, void* record) {
  Message message(*implementation_, recordNumber, std::move(request),
                  std::make_unique<CallersRecord>(record), Deadline::max());
  while (const Optional<Wait> wait = message.advance()) waitFor(*wait);
  message.complete();
}

void Client::runBatch(std::size_t recordNumber, std::span<const Request> requests,
                      const MakeSink& makeSink) {
  CallQueue queue(implementation_->engine().pool);
  for (std::size_t next = 0; next < requests.size() || !queue.isEmpty();) {
    // Only so many ahead, whatever the length of the batch.
    for (; next < requests.size() && queue.count() < queue.window(); ++next) {
      queue.push(std::make_unique<Message>(*implementation_, recordNumber, requests[next],
                                           makeSink(next), Deadline::max()));
    }
    queue.run(true);
  }
}

void Client::startTask(std::size_t recordNumber, Request request,
                       std::unique_ptr<Detail::Sink> sink, Optional<milliseconds> timeLimit) {
  implementation_->engine().eventSource().start(std::make_unique<Message>(
      *implementation_, recordNumber, std::move(request), std::move(sink),
      deadlineAfter(timeLimit.value_or(implementation_->options.timeLimit))));
}

int Client::descriptor() {
  return implementation_->engine().eventSource().descriptor();
}

void Client::dispatch() {
  implementation_->engine().eventSource().dispatch();
}

Statistics Client::statistics() const noexcept {
  return implementation_->counters.read();
}

ServiceReport Client::report() {
  const auto service =
      implementation_->engine().pool.start(deadlineAfter(implementation_->options.timeLimit));
  ServiceReport report{.version = Protocol::versionText(service->version()), .layers = {}};
  for (const NamedLayer& row : namedLayers) {
    report.layers.push_back(
        {.name = String(row.name), .present = (service->layers() & row.layer) != 0});
  }
  return report;
}

}  // namespace Keelgate
