// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/descriptors.h"

#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"

#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <algorithm>
#include <climits>

namespace Keelgate::Sandbox {

namespace {

/// Old kernels and strict profiles lack close_range. What was opened before a limit was lowered
/// lies at most below the hard limit in every setting that we know; a limit of "infinity" is cut
/// where the kernel's own default for a process ends.
void closeOneByOne(unsigned first) {
  constexpr rlim_t most = 1U << 20;
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) throw StartError(StartStep::closeDescriptors);
  const auto end = static_cast<unsigned>(std::min(limit.rlim_max, most));
  for (unsigned descriptor = first; descriptor < end; ++descriptor) {
    close(static_cast<int>(descriptor));
  }
}

}  // namespace

void keepOnly(int kept) {
  constexpr int channel = serviceDescriptor;
  if (kept != channel && dup2(kept, channel) < 0) throw StartError(StartStep::closeDescriptors);
  for (int standard = 0; standard < channel; ++standard) close(standard);
  // UINT_MAX and not INT_MAX: the whole range is the call's cheapest case.
  if (syscall(SYS_close_range, channel + 1, UINT_MAX, 0) != 0) closeOneByOne(channel + 1);
}

}  // namespace Keelgate::Sandbox
