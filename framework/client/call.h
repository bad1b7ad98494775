// SPDX-License-Identifier: Apache-2.0
/// One message, from its turn to its outcome, as a state machine that never waits: whoever drives
/// it waits, for one call or for many at once.
///
///     queued -> taking -> exchanging -> (explaining) -> (slowed) -> done
///                 ^                          |
///                 +--- once, in a worker of its own, when others had the worker before
#pragma once

#include "framework/client/pool.h"

#include <functional>

namespace Keelgate {

/// The bytes of a reply, not decoded.
struct ReceivedReply {
  Protocol::ReplyKind kind;
  Bytes body;
  /// When whoever reads it has to be done.
  Deadline deadline;
};

/// One thread at a time. It stays where it is. Dropped before it is done it gives its message up.
class Call {
 public:
  /// Takes the reply of an honest worker; throws MalformedReply when it is not one after all. What
  /// else it throws is the outcome of the message.
  using Accept = std::function<void(const ReceivedReply&)>;

  /// The pool and what the request borrows outlive the call. `alone`: in a worker that has served
  /// nobody, and this is its last try. Throws HostError, std::bad_alloc.
  Call(Pool& pool, const OutgoingMessage& request, Deadline deadline, bool alone, Accept accept);

  /// Goes on as far as it can. Gives what to wait for, or nothing when it is done.
  Optional<Wait> advance() noexcept;

  /// Of a call that is done: nothing when `accept` took the reply, else what the message's caller
  /// is to be thrown.
  [[nodiscard]] const std::exception_ptr& error() const noexcept { return error_; }

 private:
  enum class State { queued, taking, exchanging, explaining, slowed, done };

  Optional<Wait> step();
  Optional<Wait> stepQueued();
  Optional<Wait> stepTaking();
  Optional<Wait> stepExchanging();
  Optional<Wait> stepExplaining();
  void acceptReply();
  void fail(const HostError& why);
  void finish(std::exception_ptr error) noexcept;

  Pool& pool_;
  const OutgoingMessage request_;
  const Deadline deadline_;
  const Accept accept_;
  FairSemaphore::Permit permit_;
  State state_ = State::queued;
  /// Once an attempt has failed: the next worker is to have no past.
  bool retried_;
  Optional<Worker> worker_;
  Optional<Exchange> exchange_;
  /// Of `explaining`: how long the service may take to say what happened. Of `slowed`: when the
  /// error is given.
  Deadline until_{};
  std::exception_ptr error_;
};

}  // namespace Keelgate
