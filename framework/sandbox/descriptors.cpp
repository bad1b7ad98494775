// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/steps.h"

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
void closeOneByOne(unsigned first, unsigned last) {
  constexpr rlim_t most = 1U << 20;
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) throw StartError(StartStep::closeDescriptors);
  const auto end = std::min(limit.rlim_max, most);
  for (unsigned descriptor = first; descriptor <= last && descriptor < end; ++descriptor) {
    close(static_cast<int>(descriptor));
  }
}

void closeAll(unsigned first, unsigned last) {
  if (syscall(SYS_close_range, first, last, 0) != 0) closeOneByOne(first, last);
}

}  // namespace

void keepOnly(int kept) {
  constexpr unsigned channel = serviceDescriptor;
  if (kept < 0) return closeAll(0, UINT_MAX);
  if (kept != serviceDescriptor && dup3(kept, serviceDescriptor, 0) < 0) {
    throw StartError(StartStep::closeDescriptors);
  }
  closeAll(0, channel - 1);
  // UINT_MAX and not INT_MAX: the whole range is the call's cheapest case.
  closeAll(channel + 1, UINT_MAX);
}

}  // namespace Keelgate::Sandbox
