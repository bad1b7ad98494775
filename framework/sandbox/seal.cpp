// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/seal.h"

#include "framework/contracts/layers.h"
#include "framework/contracts/memory_budget.h"
#include "framework/contracts/process.h"
#include "framework/sandbox/credentials.h"
#include "framework/sandbox/descriptors.h"
#include "framework/sandbox/empty_root.h"
#include "framework/sandbox/filter.h"
#include "framework/sandbox/heap.h"
#include "framework/sandbox/landlock.h"
#include "framework/sandbox/limits.h"
#include "framework/sandbox/namespaces.h"
#include "framework/sandbox/pages.h"
#include "framework/sandbox/self_check.h"
#include "framework/sandbox/spawn.h"

#include <poll.h>
#include <unistd.h>
#include <ctime>

namespace Keelgate::Sandbox {

#ifdef KEELGATE_UNSEALED

ZygoteSeal sealZygote(std::uint32_t) {
  dieWithParent();
  return {.layers = 0, .workerFilter = {}};
}

void sealWorker(const WorkerSeal& seal) {
  keepOnly(seal.channel);
  dieWithParent();
  if (getppid() != seal.parent) _exit(0);
}

#else

namespace {

/// Whether the message is there already: then its answer is waited for, and is not to wait for us.
bool isAwaited() {
  pollfd channel{.fd = serviceDescriptor, .events = POLLIN, .revents = 0};
  constexpr timespec atOnce{};
  return ppoll(&channel, 1, &atOnce, nullptr) != 0;
}

/// In a user namespace the launcher's map decides who nobody is outside; without one, becoming
/// nobody is what it says.
std::uint32_t becomeNobodyIn(std::uint32_t layers) {
  const bool nobodyNow = becomeNobody();
  if ((layers & layerUserNamespace) == 0) return nobodyNow ? layers | layerNotRoot : layers;
  return nobodyNow ? layers : layers & ~static_cast<std::uint32_t>(layerNotRoot);
}

}  // namespace

ZygoteSeal sealZygote(std::uint32_t given) {
  std::uint32_t layers = given;

  renounceNewPrivileges();
  layers |= layerNoNewPrivileges;

  layers |= unshareNamespaces();
  if ((layers & layerMountNamespace) != 0 && enterEmptyRoot()) layers |= layerEmptyRoot;

  if (renounceByLandlock()) layers |= layerLandlock;

  layers = becomeNobodyIn(layers);
  dropCapabilities();
  layers |= layerNoCapabilities;
  dieWithParent();

  // After the launcher has written the maps: those of an undumpable process it could not open.
  becomeUndumpable();
  layers |= layerNotDumpable;

  limitZygote();
  layers |= layerLimits;

  prepareHeap();
  ZygoteSeal seal{.layers = layers, .workerFilter = compile(workerRules())};

  enforce(compile(zygoteRules()));
  proveFilter(seal.workerFilter);
  seal.layers |= layerStrictFilter | layerOneDescriptor;
  return seal;
}

void sealWorker(const WorkerSeal& seal) {
  keepOnly(seal.channel);
  dieWithParent();
  // It may have died before the line above.
  if (getppid() != seal.parent) _exit(0);
  limitWorker(seal.cpuSeconds);
  // Where there is no more to be had, the zygote's is enough for most messages.
  if (seal.longestMessage > shortMessage) growHeap(memoryBudget(seal.longestMessage));
  if (!isAwaited()) touchPages();
  enforce(seal.filter);
}

#endif

}  // namespace Keelgate::Sandbox
