// SPDX-License-Identifier: Apache-2.0
/// Keeps one service running, another one ready to take its place, and ends those that were
/// replaced. No call waits for an end, and as a rule none for a start.
///
///     stopped -> starting -> running -> (retired or lost) -> the standby runs, or stopped
///                   |                                        |
///                   +-> backing off -> stopped <-------------+ before it had answered anything
#pragma once

#include "framework/client/log_line.h"
#include "framework/client/service_process.h"

#include <memory>
#include <variant>
#include <vector>

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

/// So much of one address layout is enough: then the standby takes over, whatever happened.
constexpr std::uint64_t repliesPerLayout = 10'000;
constexpr std::chrono::minutes timePerLayout{10};

/// All members may be called from any thread.
class Supervisor {
 public:
  using Service = std::shared_ptr<ServiceProcess>;

  Supervisor(ServiceSettings settings, LogSink log, DescriptorRegistry& registry);
  /// Ends all services within 200 ms: after 100 ms whatever still runs is killed.
  ~Supervisor();
  Supervisor(const Supervisor&) = delete;
  Supervisor& operator=(const Supervisor&) = delete;

  /// The running service, or what to wait for before asking again. Throws HostError when there will
  /// be none before the deadline.
  std::variant<Service, Wait> demand(Deadline deadline);

  /// Whether this is the one that messages are given to.
  [[nodiscard]] bool isCurrent(const ServiceProcess* service) const {
    return current().get() == service;
  }
  /// It, without waiting or starting one; null when none is running.
  [[nodiscard]] Service current() const;

  /// A worker of it gave a reply that was one.
  void noteReply(ServiceProcess& service) noexcept;

  /// What nobody waits for: ends what was replaced, and starts a standby for a client that has
  /// shown to be more than a single call.
  void tidy() noexcept;

 private:
  enum class State { stopped, starting, running, backingOff };

  void start(Service& which);
  void startStandby();
  void settle();
  void replaceCurrent();
  void fail(StartFailure failure);
  [[noreturn]] void giveUp(Deadline deadline) const;
  void tellLayers();

  const ServiceSettings settings_;
  const LogSink log_;
  DescriptorRegistry& registry_;

  mutable std::mutex mutex_;
  State state_ = State::stopped;
  /// There while `running`, and while `starting` as soon as it has been spawned.
  Service current_;
  Service standby_;
  /// A single call, as of a command, is done before a standby could be of use.
  bool wantsStandby_ = false;
  /// Never, as long as one is being spawned.
  Deadline noStandbyBefore_{};
  /// Replaced, and not ended as long as somebody has a worker of them.
  std::vector<Service> replaced_;

  BackOff backOff_;
  /// Why the last start failed; nothing while a service is running.
  Optional<StartFailure> lastFailure_;
  bool layersTold_ = false;
};

}  // namespace Keelgate
