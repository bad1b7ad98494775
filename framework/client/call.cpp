// SPDX-License-Identifier: Apache-2.0
#include "framework/client/call.h"

#include "framework/contracts/start_step.h"
#include "framework/transport/wire.h"

#include <poll.h>
#include <sys/wait.h>

#include <algorithm>
#include <csignal>
#include <cstring>

namespace Keelgate {

using Reason = HostError::Reason;
using std::chrono::milliseconds;

namespace {

/// The zygote tells of a death at once; on a machine that swaps, somewhat later.
constexpr milliseconds exitPatience{500};

/// An exit status is the worker's own word, and one that was taken over may choose it: what it can
/// claim so is one of the host's errors, for the message that it was sent.
HostError explain(const ServiceProcess::Exit& exit) {
  if (exit.neverStarted) {
    return {Reason::startFailed, startFailureSentence(StartStep::startProcesses, 0)};
  }
  const int status = exit.status;
  if (WIFEXITED(status) && WEXITSTATUS(status) == Protocol::resourceExitStatus) {
    return {Reason::resourcesExhausted, ""};
  }
  // What it could not have is memory: the zygote had all the rest.
  if (WIFEXITED(status) && WEXITSTATUS(status) == Protocol::refusedExitStatus) {
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

HostError outOfMemory() {
  return {Reason::resourcesExhausted, "this process has no memory for the reply"};
}

}  // namespace

Call::Call(Pool& pool, const OutgoingMessage& request, Deadline deadline, bool alone,
           Accept accept) try
    : pool_(pool),
      request_(request),
      deadline_(deadline),
      accept_(std::move(accept)),
      permit_(pool.permits(), pool.isLarge(request.message.size())),
      retried_(alone) {
} catch (const StartFailure& failure) {
  throw HostError(Reason::startFailed, failure.sentence);
}

Optional<Wait> Call::advance() noexcept {
  while (state_ != State::done) {
    try {
      if (const Optional<Wait> wait = step()) return wait;
    } catch (const std::bad_alloc&) {
      finish(std::make_exception_ptr(outOfMemory()));
    } catch (...) {
      finish(std::current_exception());
    }
  }
  return std::nullopt;
}

Optional<Wait> Call::step() {
  switch (state_) {
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

Optional<Wait> Call::stepQueued() {
  if (permit_.isAdmitted()) {
    state_ = State::taking;
    return std::nullopt;
  }
  if (Clock::now() >= deadline_) throw HostError(Reason::timedOut, "no process came free in time");
  return Wait{.descriptor = permit_.descriptor(), .events = POLLIN, .until = deadline_};
}

Optional<Wait> Call::stepTaking() {
  auto taken = pool_.take(request_.message.size(), retried_, deadline_);
  if (const Wait* wait = std::get_if<Wait>(&taken)) return *wait;
  worker_.emplace(std::get<Worker>(std::move(taken)));
  // Not sent any more: that it is late is not the worker's doing.
  if (Clock::now() >= deadline_) throw HostError(Reason::timedOut, "no process came free in time");
  exchange_.emplace(worker_->channel(), worker_->nextSequence());
  exchange_->add(request_);
  state_ = State::exchanging;
  return std::nullopt;
}

Optional<Wait> Call::stepExchanging() {
  const Exchange::State state = exchange_->advance();
  const bool goesOn = state == Exchange::State::sending || state == Exchange::State::receiving;
  if (goesOn && Clock::now() < deadline_) {
    return Wait{
        .descriptor = worker_->channel(),
        .events = static_cast<short>(state == Exchange::State::sending ? POLLIN | POLLOUT : POLLIN),
        .until = deadline_};
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
  std::exception_ptr error;
  try {
    accept_({.kind = exchange_->kind(), .body = exchange_->body(), .deadline = deadline_});
  } catch (const Transport::MalformedReply&) {
    fail({Reason::protocolViolation, ""});
    return;
  } catch (const Transport::ReadLimitReached& reached) {
    const bool late = reached.limit == Transport::ReadLimitReached::Limit::time;
    fail({late ? Reason::timedOut : Reason::resourcesExhausted, ""});
    return;
  } catch (const std::bad_alloc&) {
    throw;
  } catch (...) {
    error = std::current_exception();
  }
  exchange_.reset();
  pool_.noteReply(*worker_);
  pool_.giveBack(std::move(*worker_));
  worker_.reset();
  // A reply can be made to take long to read, too.
  if (Clock::now() >= deadline_) {
    error = std::make_exception_ptr(HostError(Reason::timedOut, ""));
  }
  finish(std::move(error));
}

/// The message has cost its worker, and the service its layout.
void Call::fail(const HostError& why) {
  const bool hadOthers = worker_->served() > 1;
  const auto exit = worker_->exit();
  const bool abnormal = !exit || !exit->neverStarted;
  if (abnormal) worker_->service().retire();
  exchange_.reset();
  worker_.reset();
  // It may have been the doing of the messages before: this one gets a worker to itself. A message
  // that was alone with its worker has had its only try.
  if (hadOthers && !retried_ && why.reason != Reason::timedOut) {
    retried_ = true;
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
  worker_.reset();
  error_ = std::move(error);
  state_ = State::done;
  permit_.leave();
}

}  // namespace Keelgate
