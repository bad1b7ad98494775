// SPDX-License-Identifier: Apache-2.0
#include "framework/client/stack.h"

#include <keelgate/errors.h>

#include <pthread.h>

#include <cstdint>

namespace Keelgate {

namespace {

/// The lowest and the highest address of a thread's stack; both 0 where they are not known.
struct Bounds {
  std::uintptr_t low = 0;
  std::uintptr_t high = 0;
};

Bounds boundsOfThread() noexcept {
  pthread_attr_t attributes;
  if (pthread_getattr_np(pthread_self(), &attributes) != 0) return {};
  void* low = nullptr;
  std::size_t size = 0;
  const bool known = pthread_attr_getstack(&attributes, &low, &size) == 0;
  pthread_attr_destroy(&attributes);
  const auto address = reinterpret_cast<std::uintptr_t>(low);
  return known ? Bounds{.low = address, .high = address + size} : Bounds{};
}

}  // namespace

void requireStack() {
  // Once for each thread: for the first one the C library reads a file to find out.
  thread_local const Bounds bounds = boundsOfThread();
  const auto here = reinterpret_cast<std::uintptr_t>(__builtin_frame_address(0));
  // Below the stack that is more than any stack has.
  if (here - bounds.low >= minimumStack || here >= bounds.high) return;
  throw HostError(HostError::Reason::resourcesExhausted,
                  "the calling thread has " + std::to_string((here - bounds.low) / 1024) +
                      " KiB of stack left, and a call needs " +
                      std::to_string(minimumStack / 1024) + " KiB");
}

}  // namespace Keelgate
