// SPDX-License-Identifier: Apache-2.0
/// The public face: calls are made, driven, and their outcomes handed on.
#include <keelgate/client.h>

#include "framework/client/event_source.h"
#include "framework/contracts/layers.h"
#include "framework/protocol/control_frames.h"

#include <algorithm>
#include <atomic>
#include <mutex>

namespace Keelgate {

using std::chrono::milliseconds;

namespace {

/// For the first start, when no message is waiting yet: a service that is slow is to be told of.
constexpr milliseconds firstStartPatience = startPatience + milliseconds(100);

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
  explicit Implementation(Options options)
      : state{.options = bounded(std::move(options))}, engine_(new Engine(state.options)) {}

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
    auto fresh = std::make_unique<Engine>(state.options);
    // Deliberate: the inherited one is never freed.
    if (engine_.compare_exchange_strong(engine, fresh.get())) return *fresh.release();
    return *engine;
  }

  ClientState state;

 private:
  std::atomic<Engine*> engine_;
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
  Call call(implementation_->state, implementation_->engine().pool, recordNumber,
            std::move(request), std::make_unique<CallersRecord>(record));
  while (call.advance()) waitFor(call.wait());
  call.complete();
}

void Client::runBatch(std::size_t recordNumber, std::span<const Request> requests,
                      const MakeSink& makeSink) {
  Pool& pool = implementation_->engine().pool;
  CallQueue queue(pool);
  for (std::size_t next = 0; next < requests.size() || !queue.isEmpty();) {
    // Only so many ahead, whatever the length of the batch.
    for (; next < requests.size() && queue.count() < queue.window(); ++next) {
      CallList calls;
      calls.emplace_back(implementation_->state, pool, recordNumber, requests[next],
                         makeSink(next));
      queue.push(std::move(calls));
    }
    queue.run(true);
  }
}

void Client::startTask(std::size_t recordNumber, Request request,
                       std::unique_ptr<Detail::Sink> sink, Optional<milliseconds> timeLimit) {
  ClientState& state = implementation_->state;
  Engine& engine = implementation_->engine();
  CallList calls;
  calls.emplace_back(state, engine.pool, recordNumber, std::move(request), std::move(sink),
                     deadlineAfter(timeLimit.value_or(state.options.timeLimit)));
  engine.eventSource().start(std::move(calls));
}

int Client::descriptor() {
  return implementation_->engine().eventSource().descriptor();
}

void Client::dispatch() {
  implementation_->engine().eventSource().dispatch();
}

Statistics Client::statistics() const noexcept {
  return implementation_->state.outcomes.read();
}

ServiceReport Client::report() {
  const auto service =
      implementation_->engine().pool.start(deadlineAfter(implementation_->state.options.timeLimit));
  ServiceReport report{.version = Protocol::versionText(service->version()), .layers = {}};
  for (const NamedLayer& row : namedLayers) {
    report.layers.push_back(
        {.name = String(row.name), .present = (service->layers() & row.layer) != 0});
  }
  return report;
}

}  // namespace Keelgate
