// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/seal.h"

#include "framework/contracts/layers.h"
#include "framework/contracts/memory_budget.h"
#include "framework/contracts/process.h"
#include "framework/sandbox/filter.h"
#include "framework/sandbox/limits.h"
#include "framework/sandbox/namespaces.h"
#include "framework/sandbox/processes.h"
#include "framework/sandbox/rewinding.h"
#include "framework/sandbox/steps.h"

#include <poll.h>
#include <unistd.h>
#include <algorithm>
#include <ctime>

namespace Keelgate::Sandbox {

#ifndef KEELGATE_UNSEALED
namespace {

/// Whether the message comes within a moment: then its answer is not to wait for us. Where messages
/// come one after the other nothing is touched that they may not need.
bool isAwaited() {
  pollfd channel{.fd = serviceDescriptor, .events = POLLIN, .revents = 0};
  constexpr timespec moment{.tv_sec = 0, .tv_nsec = 2'000'000};
  return ppoll(&channel, 1, &moment, nullptr) != 0;
}

/// In a user namespace the launcher's map decides who nobody is outside; without one, becoming
/// nobody is what it says.
std::uint32_t becomeNobodyIn(std::uint32_t layers) {
  const bool nobodyNow = becomeNobody();
  if ((layers & layerUserNamespace) == 0) return nobodyNow ? layers | layerNotRoot : layers;
  return nobodyNow ? layers : layers & ~static_cast<std::uint32_t>(layerNotRoot);
}

}  // namespace
#endif

ZygoteSeal sealZygote() {
  resetSignals();
  // Before anything is made: what the one who started us left open must not reach a worker.
  keepOnly(serviceDescriptor);
  std::uint32_t layers = leaveGroups() ? layerNoSupplementaryGroups : 0U;

  // From here on this is the zygote; the launcher stays behind.
  const ZygoteStart start = startZygote();
  ZygoteSeal seal{.layers = 0,
                  .process = getpid(),
                  .launcher = start.launcher,
                  .childDeaths = watchChildren(),
                  .canRewind = false,
                  .workerFilter = {}};
#ifndef KEELGATE_UNSEALED
  layers |= start.layers;
  renounceNewPrivileges();
  layers |= layerNoNewPrivileges;

  offerMemoryFirst();
  layers |= unshareNamespaces();
  // Nobody else of its user may take hold of its workers, nor they of anybody.
  constexpr std::uint32_t own = layerUserNamespace | layerPidNamespace | layerMountNamespace;
  const bool prepared =
      (layers & own) == own && mayHaveDescriptors(rewindingDescriptors) && prepareRewinding();
  if ((layers & layerMountNamespace) != 0 && enterEmptyRoot()) layers |= layerEmptyRoot;
  // Its workers open files of their own, and are to find no others.
  seal.canRewind = prepared && (layers & layerEmptyRoot) != 0;
  if (!seal.canRewind) abandonRewinding();

  if (renounceByLandlock(seal.canRewind ? processesDescriptor : -1)) layers |= layerLandlock;

  layers = becomeNobodyIn(layers);
  dropCapabilities();
  layers |= layerNoCapabilities;
  // Again, since the change of credentials has reset it.
  dieWithParent();

  // After the launcher has written the maps: those of an undumpable process it could not open.
  becomeUndumpable();
  layers |= layerNotDumpable;

  limitZygote(seal.canRewind ? rewindingDescriptors : zygoteDescriptors);
  layers |= layerLimits;

  prepareHeap();
  proveEnforced(workerRules);
  seal.workerFilter = compile(workerRules);
  std::vector<Rule> rules(zygoteRules.begin(), zygoteRules.end());
  if (seal.canRewind) rules.insert(rules.end(), rewindingRules.begin(), rewindingRules.end());
  enforce(compile(rules));
  abandonFirstHeap();
  reserveHeap(heapFor(shortMessage));
  seal.layers = layers | layerStrictFilter | layerOneDescriptor;
#else
  static_cast<void>(layers);
#endif
  return seal;
}

void sealWorker(const WorkerSeal& seal) {
  if (seal.rewindable) handOver();
  keepOnly(seal.channel);
  dieWithParent();
  // It may have died before the line above.
  if (getppid() != seal.parent) _exit(0);
#ifndef KEELGATE_UNSEALED
  limitWorker(seal.cpuSeconds);
  lowerPriority();
  reserveHeap(heapFor(std::max(seal.longestMessage, shortMessage)));
  if (seal.rewindable || !isAwaited()) touchPages();
  enforce(seal.filter);
  if (seal.rewindable) awaitChannel();
#endif
}

}  // namespace Keelgate::Sandbox
