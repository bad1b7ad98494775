// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/limits.h"

#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"

#include <fcntl.h>
#include <unistd.h>
#include <algorithm>

namespace Keelgate::Sandbox {

namespace {

/// Seconds that a worker may have at the most, as the one who started the service has set it.
rlim_t cpuCeiling = RLIM_INFINITY;

void set(__rlimit_resource resource, rlim_t soft, rlim_t hard) {
#ifndef KEELGATE_UNSEALED
  const rlimit limit{.rlim_cur = soft, .rlim_max = hard};
  if (setrlimit(resource, &limit) != 0) throw StartError(StartStep::lowerLimits);
#else
  static_cast<void>(resource), static_cast<void>(soft), static_cast<void>(hard);
#endif
}

rlim_t ceilingOf(__rlimit_resource resource) {
  rlimit now{};
  if (getrlimit(resource, &now) != 0) throw StartError(StartStep::lowerLimits);
  return now.rlim_max;
}

/// Never up: the one who started the service may have set a lower one.
void lower(__rlimit_resource resource, rlim_t limit) {
  const rlim_t lowered = std::min(limit, ceilingOf(resource));
  set(resource, lowered, lowered);
}

}  // namespace

bool mayHaveDescriptors(rlim_t count) {
  return count <= ceilingOf(RLIMIT_NOFILE);
}

void limitZygote(rlim_t descriptors) {
  lower(RLIMIT_CORE, 0);
  lower(RLIMIT_FSIZE, 0);
  lower(RLIMIT_MEMLOCK, 0);
  lower(RLIMIT_MSGQUEUE, 0);
  lower(RLIMIT_STACK, stackLimit);
#ifndef KEELGATE_UNSEALED
  // With less an honest message would die of its depth, as if it were an attack.
  rlimit stack{};
  if (getrlimit(RLIMIT_STACK, &stack) != 0 || stack.rlim_cur < stackLimit) {
    throw StartError(StartStep::checkStack, 0);
  }
#endif
  lower(RLIMIT_NOFILE, descriptors);
  cpuCeiling = ceilingOf(RLIMIT_CPU);
}

void limitWorker(std::uint64_t cpuSeconds) {
  // By what the zygote has: each look at a limit is a system call, and workers are many.
  set(RLIMIT_NPROC, 0, 0);
  set(RLIMIT_NOFILE, serviceDescriptor + 1, serviceDescriptor + 1);
  // The kernel takes 0 for 1. The second more lets the readable signal come first.
  set(RLIMIT_CPU, std::min<rlim_t>(cpuSeconds, cpuCeiling),
      std::min<rlim_t>(cpuSeconds + 1, cpuCeiling));
}

bool mayHaveProcessorTime(std::uint64_t cpuSeconds) noexcept {
  return cpuSeconds <= cpuCeiling;
}

void offerMemoryFirst() {
  const int file = open("/proc/self/oom_score_adj", O_WRONLY | O_CLOEXEC);
  if (file < 0) return;
  static_cast<void>(!write(file, "1000", 4));
  close(file);
}

void lowerPriority() {
  constexpr int lowest = 19;
  if (setpriority(PRIO_PROCESS, 0, lowest) != 0) throw StartError(StartStep::lowerLimits);
}

}  // namespace Keelgate::Sandbox
