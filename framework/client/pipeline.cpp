// SPDX-License-Identifier: Apache-2.0
#include "framework/client/pipeline.h"

#include <poll.h>

#include <algorithm>

namespace Keelgate {

namespace {

/// So many messages, and the worker and its permit are given back: others wait for them, and
/// services are replaced from time to time.
constexpr std::size_t messagesPerTurn = 512;

/// A worker that has several messages may be silent for this part of the time that the oldest has
/// left. Then they part, and there is time enough for all that did not cause it.
constexpr int silentPart = 4;

}  // namespace

void Pipeline::add(CallList& from) noexcept {
  bytes_ += from.front().message().message.size();
  new_.splice(new_.end(), from, from.begin());
  if (count() == 1) oldest().beginTime();
  // To be sent at once.
  wait_ = Wait{};
}

void Pipeline::advance(CallList& done, CallList& alone) noexcept {
  try {
    wait_ = step(done, alone);
  } catch (const std::exception&) {
    // No service, no memory, no descriptor: each message finds out what that means for it.
    fail(alone);
    wait_.reset();
  }
}

Optional<Wait> Pipeline::step(CallList& done, CallList& alone) {
  if (count() == 0) {
    leave();
    return std::nullopt;
  }
  if (!worker_) {
    if (const Optional<Wait> wait = acquire()) return wait;
  }
  giveNew();
  if (!given_.empty()) return exchange(done, alone);
  // The worker has had its turn, and there are more.
  leave();
  return Wait{};
}

/// A permit and a worker, or what to wait for.
Optional<Wait> Pipeline::acquire() {
  const Deadline deadline = oldest().deadline();
  if (!permit_) permit_.emplace(pool_.permits(), false);
  if (Clock::now() >= deadline) {
    throw HostError(HostError::Reason::timedOut, "no process came free in time");
  }
  if (!permit_->isAdmitted()) {
    return Wait{.descriptor = permit_->descriptor(), .events = POLLIN, .until = deadline};
  }
  auto taken = pool_.take(longest, false, deadline);
  if (const Wait* wait = std::get_if<Wait>(&taken)) return *wait;
  worker_.emplace(std::get<Worker>(std::move(taken)));
  exchange_.emplace(worker_->channel(), static_cast<std::uint32_t>(worker_->served()));
  turn_ = std::min<std::uint64_t>(messagesPerTurn, pool_.messagesLeft(*worker_));
  return std::nullopt;
}

void Pipeline::giveNew() {
  if (worker_->service().state() != ServiceProcess::State::running) turn_ = 0;
  if (given_.empty()) lastSign_ = Clock::now();
  for (; !new_.empty() && turn_ > 0; --turn_) {
    exchange_->add(new_.front().message());
    worker_->nextSequence();
    given_.splice(given_.end(), new_, new_.begin());
  }
}

Optional<Wait> Pipeline::exchange(CallList& done, CallList& alone) {
  Exchange::State state = exchange_->advance();
  for (; state == Exchange::State::answered; state = exchange_->advance()) {
    const bool isLast = exchange_->isLast();
    if (!takeReply(done)) {
      state = Exchange::State::violated;
      break;
    }
    // Those that it was given and has not answered are given to the next.
    if (isLast) {
      worker_->finish();
      leave();
    }
    if (given_.empty()) return Wait{};
  }
  if (state == Exchange::State::died || state == Exchange::State::violated) {
    worker_->service().retire();
    fail(alone);
    return std::nullopt;
  }
  const Deadline deadline = oldest().deadline();
  const bool isSingle = count() == 1;
  const Deadline until = isSingle ? deadline : lastSign_ + (deadline - lastSign_) / silentPart;
  if (Clock::now() >= until) {
    if (isSingle) worker_->service().retire();
    fail(alone);
    return std::nullopt;
  }
  return exchange_->wait(until);
}

/// False when the reply is not one.
bool Pipeline::takeReply(CallList& done) {
  for (const String& line : exchange_->log()) logLine(pool_.log(), escapeLogLine(line));
  Call& call = given_.front();
  if (!call.take(*exchange_)) return false;
  bytes_ -= call.message().message.size();
  done.splice(done.end(), given_, given_.begin());
  if (count() > 0) oldest().beginTime();
  exchange_->drop();
  lastSign_ = Clock::now();
  depth_ = std::min(2 * depth_, capacity);
  pool_.noteReply(*worker_);
  return true;
}

/// Whatever has no reply goes alone.
void Pipeline::fail(CallList& alone) noexcept {
  exchange_.reset();
  worker_.reset();
  given_.splice(given_.end(), new_);
  for (Call& call : given_) call.goAlone();
  alone.splice(alone.end(), given_);
  bytes_ = 0;
  depth_ = 1;
  leave();
}

/// Gives back the worker and the permit. What it was given and has not answered is new again.
void Pipeline::leave() noexcept {
  exchange_.reset();
  new_.splice(new_.begin(), given_);
  if (worker_) pool_.giveBack(std::move(*worker_));
  worker_.reset();
  if (!permit_) return;
  permit_.reset();
  pool_.tidy();
}

}  // namespace Keelgate
