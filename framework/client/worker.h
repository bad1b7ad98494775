// SPDX-License-Identifier: Apache-2.0
/// One worker of a service, owned. It keeps its service from being ended.
#pragma once

#include "framework/client/descriptor.h"
#include "framework/client/exchange.h"
#include "framework/client/service_process.h"

#include <keelgate/errors.h>

#include <memory>

namespace Keelgate {

/// One thread at a time. A worker that is dropped before it has finished is killed.
class Worker {
 public:
  Worker(std::shared_ptr<ServiceProcess> service, ServiceProcess::Forked forked) noexcept
      : service_(std::move(service)), slot_(forked.slot), channel_(std::move(forked.channel)) {}
  Worker(Worker&&) noexcept = default;
  Worker& operator=(Worker&&) = delete;
  ~Worker() {
    // Moved from.
    if (!service_) return;
    using Leaving = ServiceProcess::Leaving;
    service_->release(slot_, finished_ ? Leaving::byItself : Leaving::killed);
  }

  [[nodiscard]] int channel() const noexcept { return channel_.get(); }
  [[nodiscard]] WorkerSign sign() const noexcept { return signOf(channel_.get()); }
  /// The sequence number of its next message.
  std::uint32_t nextSequence() noexcept { return served_++; }
  /// How many messages it has been given.
  [[nodiscard]] std::uint64_t served() const noexcept { return served_; }
  /// Nothing more is to come from it. Before the next worker is forked: to close a socket while
  /// another one is on its way to a process has the kernel look for lost ones.
  void hangUp() noexcept { channel_.close(); }
  /// It ends by itself: it has had its last message, or its channel is closed.
  void finish() noexcept { finished_ = true; }
  [[nodiscard]] bool isFinished() const noexcept { return finished_; }

  /// How it ended, once the service knows.
  [[nodiscard]] Optional<ServiceProcess::Exit> exit() const { return service_->exitOf(slot_); }
  [[nodiscard]] ServiceProcess& service() const noexcept { return *service_; }

 private:
  std::shared_ptr<ServiceProcess> service_;
  std::uint32_t slot_;
  Descriptor channel_;
  std::uint32_t served_ = 0;
  bool finished_ = false;
};

}  // namespace Keelgate
