// SPDX-License-Identifier: Apache-2.0
#include "bench/rewind/rewinding_seal.h"

#include "bench/rewind/rewindable_worker.h"
#include "framework/contracts/layers.h"
#include "framework/contracts/process.h"
#include "framework/contracts/start_step.h"
#include "framework/sandbox/credentials.h"
#include "framework/sandbox/descriptors.h"
#include "framework/sandbox/empty_root.h"
#include "framework/sandbox/filter.h"
#include "framework/sandbox/heap.h"
#include "framework/sandbox/launcher.h"
#include "framework/sandbox/limits.h"
#include "framework/sandbox/namespaces.h"
#include "framework/sandbox/processes.h"

#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <vector>

namespace Keelgate::Rewind {

namespace {

using Sandbox::Rule;
using Sandbox::Verdict;

/// All that rewinding takes beyond a zygote's calls. It stands before them: the first rule for a
/// call is the one that counts.
constexpr Rule tracing[] = {
    // For each message.
    {SYS_ptrace, Verdict::allow},
    {SYS_ioctl, Verdict::allow},
    {SYS_pwrite64, Verdict::allow},
    {SYS_clock_gettime, Verdict::allow},
    // For each worker.
    {SYS_pread64, Verdict::allow},
    {SYS_madvise, Verdict::allowWith, MADV_DONTFORK, 2},
    {SYS_munmap, Verdict::allow},
    {SYS_openat, Verdict::allow},
    {SYS_pidfd_open, Verdict::allow},
    {SYS_pidfd_getfd, Verdict::allow},
    // In a new worker, until its own filter stands.
    {SYS_userfaultfd, Verdict::allow},
    {SYS_getpid, Verdict::allow},
    {SYS_prctl, Verdict::allow},
    {SYS_landlock_create_ruleset, Verdict::allow},
    {SYS_landlock_restrict_self, Verdict::allow},
};

std::vector<Rule> zygoteRules() {
  std::vector<Rule> rules(std::begin(tracing), std::end(tracing));
  for (const Rule& rule : Sandbox::zygoteRules()) {
    if (rule.call != SYS_prctl) rules.push_back(rule);
  }
  return rules;
}

/// Of this process namespace, and mounted nowhere.
int openProcesses() {
  const File context(static_cast<int>(syscall(SYS_fsopen, "proc", FSOPEN_CLOEXEC)));
  syscall(SYS_fsconfig, context.get(), FSCONFIG_CMD_CREATE, nullptr, nullptr, 0);
  const long mounted = syscall(SYS_fsmount, context.get(), FSMOUNT_CLOEXEC,
                               MOUNT_ATTR_NOSUID | MOUNT_ATTR_NODEV | MOUNT_ATTR_NOEXEC);
  // Such a machine would stay with forks.
  if (mounted < 0) throw StartError(StartStep::watchProcesses);
  return static_cast<int>(mounted);
}

/// The end of a channel whose other end is closed.
int makeNowhere() {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
    throw StartError(StartStep::watchProcesses);
  }
  close(ends[0]);
  return ends[1];
}

/// As the product's, but for the descriptors: it holds three for each worker.
void limitZygote() {
  const auto lower = [](__rlimit_resource resource, rlim_t to) {
    const rlimit limit{.rlim_cur = to, .rlim_max = to};
    if (setrlimit(resource, &limit) != 0) throw StartError(StartStep::lowerLimits);
  };
  for (const auto resource : {RLIMIT_CORE, RLIMIT_FSIZE, RLIMIT_MEMLOCK, RLIMIT_MSGQUEUE}) {
    lower(resource, 0);
  }
  lower(RLIMIT_STACK, Sandbox::stackLimit);
  lower(RLIMIT_NOFILE, trackingDescriptor + 1);
}

}  // namespace

RewindingSeal sealRewindingZygote() {
  Sandbox::resetSignals();
  Sandbox::keepOnly(serviceDescriptor);
  std::uint32_t layers = Sandbox::leaveGroups() ? layerNoSupplementaryGroups : 0U;
  const Sandbox::ZygoteStart start = Sandbox::startZygote();
  RewindingSeal seal{.zygote = {.layers = 0,
                                .process = getpid(),
                                .launcher = start.launcher,
                                .childDeaths = Sandbox::watchChildren(),
                                .workerFilter = {}},
                     .proc = -1,
                     .notices = -1,
                     .nowhere = makeNowhere()};
  layers |= start.layers | layerNoNewPrivileges;
  Sandbox::renounceNewPrivileges();
  Sandbox::offerMemoryFirst();
  layers |= Sandbox::unshareNamespaces();
  seal.proc = openProcesses();
  if ((layers & layerMountNamespace) != 0 && Sandbox::enterEmptyRoot()) layers |= layerEmptyRoot;
  // Deliberate: no Landlock, which would keep this process from its workers' files. Workers take
  // it for themselves.
  if (Sandbox::becomeNobody()) layers |= layerNotRoot;
  Sandbox::dropCapabilities();
  Sandbox::dieWithParent();
  Sandbox::becomeUndumpable();
  limitZygote();
  Sandbox::prepareHeap();
  Sandbox::proveEnforced(Sandbox::workerRules());
  seal.zygote.workerFilter = Sandbox::compile(Sandbox::workerRules());
  seal.notices = noticeEnds();
  Sandbox::enforce(Sandbox::compile(zygoteRules()));
  Sandbox::abandonFirstHeap();
  seal.zygote.layers = layers | layerNoCapabilities | layerNotDumpable | layerLimits |
                       layerStrictFilter | layerOneDescriptor | layerLandlock;
  return seal;
}

}  // namespace Keelgate::Rewind
