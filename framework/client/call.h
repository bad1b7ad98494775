// SPDX-License-Identifier: Apache-2.0
/// One message, from its turn to its outcome, as a state machine that never waits: whoever drives
/// it waits, for one call or for many at once.
///
///     begun -> queued -> taking -> exchanging -> (explaining) -> (slowed) -> done
///                          ^                          |
///                          +--- once, in a worker of its own, when others had the worker before
///
/// A short message may go together with others instead (Pipeline). Then it comes this way only if
/// that brings no good reply.
#pragma once

#include "framework/client/outcome_counts.h"
#include "framework/client/pool.h"

#include <exception>
#include <list>
#include <memory>

namespace Keelgate {

/// What the calls of a client share, in whatever process.
struct ClientState {
  const Client::Options options;
  OutcomeCounts outcomes{};
  /// Made beforehand: there may be no memory for it when it is needed.
  const std::exception_ptr noMemory = std::make_exception_ptr(
      HostError(HostError::Reason::resourcesExhausted, "this process has no memory for it"));
};

/// One thread at a time. It stays where it is. Dropped before it is done it gives its message up.
class Call {
 public:
  /// The client, the pool and the bytes of the message outlive the call. Without a deadline it has
  /// the time limit of the options from when it begins.
  Call(ClientState& client, Pool& pool, std::size_t recordNumber, Client::Request request,
       std::unique_ptr<Detail::Sink> sink, Deadline deadline = Deadline::max());

  /// When advance() ends it even if it has not begun.
  [[nodiscard]] Deadline deadline() const noexcept { return deadline_; }
  [[nodiscard]] const OutgoingMessage& message() const noexcept { return message_; }

  /// Whether it may go together with others; otherwise it is to be advanced.
  [[nodiscard]] bool isShared() const noexcept;
  /// Before it does: false where it cannot be sent, and goes alone.
  bool mayBeSent() noexcept;
  /// It is at the head of those that share a worker: from now on its time counts.
  void beginTime() noexcept;
  /// Takes the reply to it. False: it is to go alone, because what came is not a good reply.
  bool take(const Exchange& exchange) noexcept;
  /// From now on: in a worker that has served nobody, and this is its last try.
  void goAlone() noexcept { alone_ = true; }

  /// Goes on by itself as far as it can. False when it is done.
  bool advance() noexcept;
  /// What to wait for before it is advanced again; at first nothing.
  [[nodiscard]] const Wait& wait() const noexcept { return wait_; }

  /// Counts the outcome of a call that has taken its reply or is done, and tells whoever asked for
  /// it. Nothing is done with it afterwards.
  void complete();

 private:
  enum class State { begun, queued, taking, exchanging, explaining, slowed, done };

  void check() const;
  Optional<Wait> step();
  void stepBegun();
  Optional<Wait> stepQueued();
  Optional<Wait> stepTaking();
  Optional<Wait> stepExchanging();
  Optional<Wait> stepExplaining();
  void acceptReply();
  void read(const Exchange& exchange);
  void fail(const HostError& why);
  void finish(std::exception_ptr error) noexcept;

  ClientState& client_;
  Pool& pool_;
  const Client::Request request_;
  const OutgoingMessage message_;
  const std::unique_ptr<Detail::Sink> sink_;
  Deadline deadline_;
  State state_ = State::begun;
  Wait wait_;
  Optional<FairSemaphore::Permit> permit_;
  /// It has shared a worker, or an attempt has failed: the next worker is to have no past.
  bool alone_ = false;
  Optional<Worker> worker_;
  Optional<Exchange> exchange_;
  /// Of `explaining`: how long the service may take to say what happened. Of `slowed`: when the
  /// error is given.
  Deadline until_{};
  /// Nothing with a record, else what the message's caller is to be thrown.
  std::exception_ptr error_;
};

/// So calls change hands without an allocation.
using CallList = std::list<Call>;

}  // namespace Keelgate
