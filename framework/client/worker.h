// SPDX-License-Identifier: Apache-2.0
/// One worker of a service, owned.
///
/// It keeps its service alive: a service that has been replaced ends with the last worker of it
/// that somebody still waits for.
#pragma once

#include "framework/client/data_channel.h"
#include "framework/client/service_process.h"

#include <keelgate/errors.h>

#include <memory>

namespace Keelgate {

/// One thread at a time. A worker that is dropped before it has finished is killed.
class Worker {
 public:
  Worker(std::shared_ptr<ServiceProcess> service, ServiceProcess::Forked forked) noexcept
      : service_(std::move(service)),
        slot_(forked.slot),
        channel_(std::move(forked.channel), forked.heap) {}
  Worker(Worker&&) noexcept = default;
  Worker& operator=(Worker&&) = delete;
  ~Worker();

  /// Gives the message to the worker. The reply, or what became of the worker: its death is
  /// explained by its wait status, and one that is late or lies is killed. Throws std::bad_alloc.
  /// After an error it must be dropped.
  Optional<HostError> exchange(const ClientRequest& request, Deadline deadline,
                               ReceivedReply& reply);

  [[nodiscard]] DataChannel::Look look() const noexcept { return channel_.look(); }
  /// It ends by itself: it has had its last message.
  void finish() noexcept { finished_ = true; }

  /// How many messages it has been given.
  [[nodiscard]] std::uint64_t served() const noexcept { return served_; }
  [[nodiscard]] const ServiceProcess* service() const noexcept { return service_.get(); }

 private:
  HostError explainDeath();

  std::shared_ptr<ServiceProcess> service_;
  std::uint32_t slot_;
  DataChannel channel_;
  std::uint64_t served_ = 0;
  /// Set when it may be left to end by itself.
  bool finished_ = false;
};

/// The error for an answer that is none.
HostError lie();

}  // namespace Keelgate
