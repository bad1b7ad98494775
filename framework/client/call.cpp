// SPDX-License-Identifier: Apache-2.0
#include "framework/client/call.h"

#include "framework/client/pipeline.h"
#include "framework/client/stack.h"
#include "framework/contracts/memory_budget.h"
#include "framework/contracts/start_step.h"
#include "framework/transport/error_coding.h"
#include "framework/transport/record_coding.h"
#include "text/utf8.h"

#include <poll.h>
#include <sys/wait.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <cstring>

namespace Keelgate {

using Reason = HostError::Reason;
using std::chrono::milliseconds;
using VespKeelgateService::VespClientMessageUnpackingError;

namespace {

/// The zygote tells of a death at once; on a machine that swaps, somewhat later.
constexpr milliseconds exitPatience{500};

/// An exit status is the worker's own word, and one that was taken over may choose it: what it can
/// claim so is one of the host's errors, for the message that it was sent.
HostError explain(const ServiceProcess::Exit& exit) {
  if (exit.neverStarted) {
    return {Reason::startFailed, startFailureSentence(StartStep::startProcesses, 0)};
  }
  // The exit status of one that a signal ended is 0.
  const int status = exit.status;
  if (WEXITSTATUS(status) == Protocol::resourceExitStatus) return {Reason::resourcesExhausted, ""};
  // What it could not have is memory: the zygote had all the rest.
  if (WEXITSTATUS(status) == Protocol::refusedExitStatus) {
    return {Reason::resourcesExhausted, "the machine has no memory for its worker"};
  }
  if (WIFEXITED(status)) {
    return {Reason::crashed,
            "it ended with status " + std::to_string(WEXITSTATUS(status)) + " and no answer"};
  }
  const int signal = WTERMSIG(status);
  // The kernel's limit, which stands behind the deadline: we were stopped ourselves.
  if (signal == SIGXCPU) return {Reason::timedOut, "it used up its processor time"};
  return {Reason::crashed, "signal " + std::to_string(signal) + " (" + strsignal(signal) + ")"};
}

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

}  // namespace

Call::Call(ClientState& client, Pool& pool, std::size_t recordNumber, Client::Request request,
           std::unique_ptr<Detail::Sink> sink, Deadline deadline)
    : client_(client),
      pool_(pool),
      request_(std::move(request)),
      message_{.record = static_cast<std::uint16_t>(recordNumber),
               .command = request_.context.command,
               .service = request_.context.service,
               .message = request_.message},
      sink_(std::move(sink)),
      deadline_(deadline) {}

bool Call::isShared() const noexcept {
  return !alone_ && message_.message.size() <= Pipeline::longest;
}

bool Call::mayBeSent() noexcept try {
  check();
  return true;
} catch (...) {
  // What is wrong is found again, and told then.
  return false;
}

void Call::beginTime() noexcept {
  if (deadline_ == Deadline::max()) deadline_ = deadlineAfter(client_.options.timeLimit);
}

bool Call::take(const Exchange& exchange) noexcept try {
  read(exchange);
  // A reply can be made to take long to read, too.
  return Clock::now() < deadline_;
} catch (...) {
  return false;
}

bool Call::advance() noexcept {
  // First of all, so that nothing that follows goes uncounted.
  beginTime();
  while (state_ != State::done) {
    try {
      if (const Optional<Wait> wait = step()) {
        wait_ = *wait;
        return true;
      }
    } catch (const std::bad_alloc&) {
      finish(client_.noMemory);
    } catch (...) {
      finish(std::current_exception());
    }
  }
  return false;
}

void Call::complete() {
  try {
    if (error_) std::rethrow_exception(error_);
    client_.outcomes.countRecord();
  } catch (const HostError& error) {
    client_.outcomes.count(error.reason);
  } catch (...) {
    client_.outcomes.countRejection();
  }
  sink_->complete(std::move(error_));
}

void Call::check() const {
  requireStack();
  checkSize("the message", message_.message.size(), client_.options.largestMessage);
  checkSize("the service identifier", message_.service.size(), Protocol::maximumServiceLength);
  // What is not UTF-8 could not travel, and the table of services has none such.
  if (!Text::isUtf8(message_.service)) {
    throw VespClientMessageUnpackingError::noUnpackerForService(request_.context.service);
  }
}

Optional<Wait> Call::step() {
  switch (state_) {
    case State::begun:
      stepBegun();
      break;
    case State::queued:
      return stepQueued();
    case State::taking:
      return stepTaking();
    case State::exchanging:
      return stepExchanging();
    case State::explaining:
      return stepExplaining();
    case State::slowed:
      if (Clock::now() < until_) return Wait{.until = until_};
      state_ = State::done;
      break;
    case State::done:
      break;
  }
  return std::nullopt;
}

void Call::stepBegun() {
  check();
  permit_.emplace(pool_.permits(), pool_.isLarge(message_.message.size()));
  state_ = State::queued;
}

Optional<Wait> Call::stepQueued() {
  if (permit_->isAdmitted()) {
    state_ = State::taking;
    return std::nullopt;
  }
  if (Clock::now() >= deadline_) throw HostError(Reason::timedOut, "no process came free in time");
  return Wait{.descriptor = permit_->descriptor(), .events = POLLIN, .until = deadline_};
}

Optional<Wait> Call::stepTaking() {
  auto taken = pool_.take(message_.message.size(), alone_, deadline_);
  if (const Wait* wait = std::get_if<Wait>(&taken)) return *wait;
  worker_.emplace(std::get<Worker>(std::move(taken)));
  // Not sent any more: that it is late is not the worker's doing.
  if (Clock::now() >= deadline_) throw HostError(Reason::timedOut, "no process came free in time");
  exchange_.emplace(worker_->channel(), worker_->nextSequence());
  exchange_->add(message_);
  state_ = State::exchanging;
  return std::nullopt;
}

Optional<Wait> Call::stepExchanging() {
  const Exchange::State state = exchange_->advance();
  const bool goesOn = state == Exchange::State::sending || state == Exchange::State::receiving;
  if (goesOn && Clock::now() < deadline_) {
    return exchange_->wait(deadline_);
  }
  for (const String& line : exchange_->log()) logLine(pool_.log(), escapeLogLine(line));
  switch (state) {
    case Exchange::State::sending:
    case Exchange::State::receiving:
      fail({Reason::timedOut, ""});
      break;
    case Exchange::State::answered:
      acceptReply();
      break;
    case Exchange::State::violated:
      fail({Reason::protocolViolation, ""});
      break;
    case Exchange::State::died:
      until_ = std::max(deadline_, Clock::now() + exitPatience);
      state_ = State::explaining;
      break;
  }
  return std::nullopt;
}

Optional<Wait> Call::stepExplaining() {
  ServiceProcess& service = worker_->service();
  service.readNews();
  if (const auto exit = worker_->exit()) {
    fail(explain(*exit));
  } else if (service.state() == ServiceProcess::State::lost) {
    fail({Reason::crashed, "the service ended with it"});
  } else if (Clock::now() >= until_) {
    fail({Reason::crashed, "the service did not say how"});
  } else {
    return service.waitForNews(until_);
  }
  return std::nullopt;
}

void Call::acceptReply() {
  if (exchange_->isLast()) worker_->finish();
  // Before the reply is read: the next worker is forked meanwhile.
  if (pool_.isSpent(*worker_)) {
    worker_->hangUp();
    pool_.tidy();
  }
  try {
    read(*exchange_);
  } catch (const Transport::MalformedReply&) {
    fail({Reason::protocolViolation, ""});
    return;
  } catch (const Transport::ReadLimitReached& reached) {
    const bool late = reached.limit == Transport::ReadLimitReached::Limit::time;
    fail({late ? Reason::timedOut : Reason::resourcesExhausted, ""});
    return;
  }
  pool_.noteReply(*worker_);
  pool_.giveBack(std::move(*worker_));
  if (Clock::now() >= deadline_) throw HostError(Reason::timedOut, "");
  finish(std::move(error_));
}

/// Takes a reply: the record, or the error that it holds. Throws what else comes of it.
void Call::read(const Exchange& exchange) {
  error_ = nullptr;
  const Transport::ReadLimits limits{.memory = memoryBudget(message_.message.size()),
                                     .deadline = deadline_};
  try {
    if (exchange.kind() == Protocol::ReplyKind::error) {
      Transport::throwError(exchange.body(), limits);
    }
    recordReaders.at(message_.record)(exchange.body(), limits, sink_->makeRecord());
  } catch (const Error&) {
    error_ = std::current_exception();
  }
}

/// The message has cost its worker, and the service its layout.
void Call::fail(const HostError& why) {
  const bool hadOthers = worker_->served() > 1;
  const auto exit = worker_->exit();
  const bool abnormal = !exit || !exit->neverStarted;
  if (abnormal) worker_->service().retire();
  worker_.reset();
  // It may have been the doing of the messages before: this one gets a worker to itself. A message
  // that was alone with its worker has had its only try.
  if (hadOthers && !alone_ && why.reason != Reason::timedOut) {
    alone_ = true;
    state_ = State::taking;
    return;
  }
  finish(std::make_exception_ptr(why));
  pool_.tidy();
  if (!abnormal) return;
  // The permit is given back by now: nobody waits with this one.
  until_ = std::min(deadline_, pool_.noteAbnormalEnd());
  state_ = State::slowed;
}

void Call::finish(std::exception_ptr error) noexcept {
  exchange_.reset();
  error_ = std::move(error);
  state_ = State::done;
  permit_.reset();
}

}  // namespace Keelgate
