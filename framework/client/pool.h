// SPDX-License-Identifier: Apache-2.0
/// The workers of a client: one message each by default, and a fresh one forked ahead. A call waits
/// for one of `permits()` first, of which there is one for each process that the options grant, and
/// then for a worker that it can `take()`.
#pragma once

#include "framework/client/fair_semaphore.h"
#include "framework/client/log_line.h"
#include "framework/client/supervisor.h"
#include "framework/client/worker.h"

#include <keelgate/client.h>

#include <algorithm>
#include <deque>
#include <mutex>
#include <variant>

namespace Keelgate {

/// The number of processes that options stand for.
std::size_t processesFor(const Client::Options& options);

/// The most calls at a time in the last seconds. What was needed once and is no more is forgotten.
class RecentPeak {
 public:
  void note(std::size_t now, Deadline at) noexcept;
  [[nodiscard]] std::size_t value() const noexcept { return std::max(before_, here_); }

 private:
  Deadline since_{};
  std::size_t before_ = 1;
  std::size_t here_ = 1;
};

/// Spaces abnormal ends out: somebody who makes one message after the other fail, to search for an
/// address or to keep services restarting, is answered late, and nobody else is.
class AbnormalEnds {
 public:
  explicit AbnormalEnds(unsigned perSecond) noexcept : perSecond_(perSecond) {}
  /// Counts one, and gives when it may be answered.
  Deadline note(Deadline now) noexcept;

 private:
  unsigned perSecond_;
  Deadline next_{};
};

/// All members may be called from any thread, except where a process has been forked: there only
/// isOurs and abandon.
class Pool {
 public:
  /// Starts nothing yet.
  explicit Pool(const Client::Options& options);
  Pool(const Pool&) = delete;
  Pool& operator=(const Pool&) = delete;

  /// Waits for a running service, and has the first workers forked. Throws HostError.
  Supervisor::Service start(Deadline deadline);

  /// A worker for a message of so many bytes, `fresh` or one that may have served others; or what
  /// to wait for before asking again. Throws HostError.
  std::variant<Worker, Wait> take(std::size_t length, bool fresh, Deadline deadline);
  /// Whether the worker has had its last message.
  [[nodiscard]] bool isSpent(const Worker& worker) const noexcept {
    return worker.isFinished() || worker.served() >= settings_.messagesPerWorker;
  }
  /// Whether a worker is used again.
  [[nodiscard]] bool sharesWorkers() const noexcept { return settings_.messagesPerWorker > 1; }
  /// How many more messages it may be given.
  [[nodiscard]] std::uint64_t messagesLeft(const Worker& worker) const noexcept {
    return isSpent(worker) ? 0 : settings_.messagesPerWorker - worker.served();
  }
  /// It gave a reply that was one.
  void noteReply(const Worker& worker) noexcept { supervisor_.noteReply(worker.service()); }
  /// A worker that has answered all that it was given. It is used again, or ends.
  void giveBack(Worker worker) noexcept;
  /// What follows a message, and nobody waits for: workers are forked for those that come next,
  /// services that were replaced are ended.
  void tidy() noexcept;
  /// When a message that ended abnormally may be answered.
  Deadline noteAbnormalEnd() noexcept;

  [[nodiscard]] FairSemaphore& permits() noexcept { return permits_; }
  [[nodiscard]] bool isLarge(std::size_t length) const noexcept;
  [[nodiscard]] std::size_t processes() const noexcept { return processes_; }
  [[nodiscard]] const LogSink& log() const noexcept { return log_; }
  [[nodiscard]] DescriptorRegistry& registry() noexcept { return registry_; }

  /// Whether this is the process that made the pool, and not a fork of it.
  [[nodiscard]] bool isOurs() const noexcept { return mark_.isOurs(); }
  /// In a fork: closes its copies of the descriptors. Nothing else of the pool can be used or
  /// freed there, because threads that no longer exist may have held its locks.
  void abandon() noexcept { registry_.closeAll(); }

 private:
  Optional<Worker> takeIdle(const Supervisor::Service& service);
  std::size_t startForking(const ServiceProcess& service) noexcept;
  void forkAhead(const Supervisor::Service& service) noexcept;
  void keepIdle(Worker worker) noexcept;

  const ForkMark mark_;
  const std::size_t processes_;
  const ServiceSettings settings_;
  /// Bytes: what a worker is forked for before its message is known.
  const std::uint64_t expectedLength_;
  const LogSink log_;
  DescriptorRegistry registry_;
  FairSemaphore permits_;
  Supervisor supervisor_;

  std::mutex mutex_;
  /// Workers of the current service.
  std::deque<Worker> idle_;
  std::size_t forking_ = 0;
  RecentPeak busy_;
  AbnormalEnds abnormalEnds_;
};

}  // namespace Keelgate
