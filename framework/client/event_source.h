// SPDX-License-Identifier: Apache-2.0
/// Lets an event loop of the application drive calls: one descriptor to poll for all of them.
#pragma once

#include "framework/client/call_queue.h"

namespace Keelgate {

/// All members may be called from any thread, and by completions.
class EventSource {
 public:
  /// Throws HostError when there are no descriptors left.
  explicit EventSource(Pool& pool);

  void start(CallList calls);
  /// Readable when dispatch() has something to do.
  [[nodiscard]] int descriptor() const noexcept { return epoll_.get(); }
  /// Goes on with all that can, and runs completions. Where another thread is doing that, nothing.
  void dispatch();

 private:
  void arm(int descriptor, std::uint32_t events);
  void armAll();

  CallQueue queue_;
  std::mutex dispatching_;
  Descriptor epoll_;
  Descriptor timer_;
  Descriptor wakeUp_;
};

}  // namespace Keelgate
