// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/limits.h"

#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"

#include <algorithm>

namespace Keelgate::Sandbox {

namespace {

void limit(__rlimit_resource resource, rlim_t soft, rlim_t hard) {
#ifndef KEELGATE_UNSEALED
  // Never up: the one who started the service may have set a lower one.
  rlimit now{};
  if (getrlimit(resource, &now) != 0) throw StartError(StartStep::lowerLimits);
  const rlimit lowered{.rlim_cur = std::min(soft, now.rlim_max),
                       .rlim_max = std::min(hard, now.rlim_max)};
  if (setrlimit(resource, &lowered) != 0) throw StartError(StartStep::lowerLimits);
#else
  static_cast<void>(resource), static_cast<void>(soft), static_cast<void>(hard);
#endif
}

}  // namespace

void limitZygote() {
  limit(RLIMIT_CORE, 0, 0);
  limit(RLIMIT_FSIZE, 0, 0);
  limit(RLIMIT_MEMLOCK, 0, 0);
  limit(RLIMIT_MSGQUEUE, 0, 0);
  limit(RLIMIT_STACK, stackLimit, stackLimit);
#ifndef KEELGATE_UNSEALED
  // With less an honest message would die of its depth, as if it were an attack.
  rlimit stack{};
  if (getrlimit(RLIMIT_STACK, &stack) != 0 || stack.rlim_cur < stackLimit) {
    throw StartError(StartStep::checkStack, 0);
  }
#endif
  limit(RLIMIT_NOFILE, zygoteDescriptors, zygoteDescriptors);
}

void limitWorker(std::uint64_t cpuSeconds) {
  limit(RLIMIT_NPROC, 0, 0);
  limit(RLIMIT_NOFILE, serviceDescriptor + 1, serviceDescriptor + 1);
  // The kernel takes 0 for 1. The second more lets the readable signal come first.
  limit(RLIMIT_CPU, cpuSeconds, cpuSeconds + 1);
}

}  // namespace Keelgate::Sandbox
