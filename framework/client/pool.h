// SPDX-License-Identifier: Apache-2.0
/// The workers of a client: one message each by default, a fresh one forked ahead, a new service
/// where the old one died or could be learnt from.
#pragma once

#include "framework/client/log_line.h"
#include "framework/client/turnstile.h"
#include "framework/client/worker.h"

#include <keelgate/client.h>

#include <sys/types.h>

#include <condition_variable>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>

namespace Keelgate {

/// How long to wait before a service that died is started again: 0, 10, 100, 1000 ms, 10 s, and
/// from then on a minute. A service that cannot live here must not take a processor for itself.
class BackOff {
 public:
  void noteDeath() noexcept;
  void noteGoodReply() noexcept { deaths_ = 0; }
  [[nodiscard]] Deadline notBefore() const noexcept { return notBefore_; }

 private:
  std::size_t deaths_ = 0;
  Deadline notBefore_{};
};

/// All members may be called from any thread, except where a process has been forked: there only
/// isOurs and abandon.
class Pool {
 public:
  /// Starts the service. Throws HostError (startFailed).
  Pool(const Client::Options& options, std::size_t processes);
  /// Ends it. No call may be under way.
  ~Pool();
  Pool(const Pool&) = delete;
  Pool& operator=(const Pool&) = delete;

  /// Takes the reply of an honest worker; throws MalformedReply when it is none after all. What
  /// else it throws is the outcome of the message.
  using Accept = std::function<void(const ReceivedReply&)>;

  /// Gives the message to a worker, and the reply to `accept`. Throws HostError.
  void exchange(const ClientRequest& request, Deadline deadline, const Accept& accept);

  /// What the running service said of itself: Protocol::versionText takes the one, and bits of
  /// Layer are the other.
  struct Report {
    std::uint64_t version;
    std::uint64_t layers;
  };
  /// Throws HostError.
  Report report(Deadline deadline);

  /// Whether this is the process that made the pool, and not a fork of it.
  [[nodiscard]] bool isOurs() const noexcept;
  /// In a fork: closes its copies of the descriptors. Nothing else of the pool can be used or
  /// freed there, because threads that no longer exist may have held its locks.
  void abandon() noexcept { book_.closeAll(); }

 private:
  using Lock = std::unique_lock<std::mutex>;
  using Service = std::shared_ptr<ServiceProcess>;
  class Place;

  Optional<HostError> attempt(Worker worker, const ClientRequest& request, Deadline deadline,
                              const Accept& accept, std::uint64_t mayServe);
  void keep(Worker worker, bool spent);
  Worker take(std::size_t length, Deadline deadline, bool fresh);
  Optional<Worker> takeIdle();
  void forkAhead() noexcept;
  Optional<Worker> forkQuietly(const Service& service) const noexcept;

  Service running(Lock& lock, Deadline deadline);
  void awaitBackOff(Lock& lock, Deadline deadline);
  void start(Lock& lock, Deadline deadline);
  void tellLayers(const ServiceProcess& service);

  const pid_t owner_;
  const ServiceSettings settings_;
  /// Bytes: what a worker must be ready for before its message is known.
  const std::uint64_t foreseen_;
  const LogSink log_;
  DescriptorBook book_;
  Turnstile turnstile_;

  std::mutex mutex_;
  Service service_;
  /// Workers of `service_`.
  std::deque<Worker> idle_;
  std::size_t forking_ = 0;
  /// Calls that hold a place, and the most that ever did at a time: so many workers are kept.
  std::size_t busy_ = 0;
  std::size_t mostBusy_ = 1;

  BackOff backOff_;
  String lastFailure_;
  /// Whether a good reply has come since the last start: a service that dies before any counts as
  /// one that died while it was starting.
  bool proved_ = false;
  bool layersTold_ = false;
  /// One call starts the service, the others wait.
  bool starting_ = false;
  std::condition_variable started_;
};

}  // namespace Keelgate
