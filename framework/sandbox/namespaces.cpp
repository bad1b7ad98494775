// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/namespaces.h"

#include "framework/contracts/layers.h"
#include "framework/contracts/start_step.h"
#include "framework/sandbox/processes.h"

#include <fcntl.h>
#include <linux/sched.h>
#include <sched.h>
#include <unistd.h>
#include <array>
#include <string>

namespace Keelgate::Sandbox {

namespace {

struct NamespaceRow {
  int flag;
  Layer layer;
};
constexpr std::array namespaceRows{
    NamespaceRow{CLONE_NEWNS, layerMountNamespace},
    NamespaceRow{CLONE_NEWNET, layerNetworkNamespace},
    NamespaceRow{CLONE_NEWIPC, layerIpcNamespace},
    NamespaceRow{CLONE_NEWUTS, layerUtsNamespace},
    NamespaceRow{CLONE_NEWCGROUP, layerCgroupNamespace},
};

bool writeTo(const std::string& path, const std::string& text) {
  const int file = open(path.c_str(), O_WRONLY | O_CLOEXEC);
  if (file < 0) return false;
  const bool written = write(file, text.data(), text.size()) == static_cast<ssize_t>(text.size());
  close(file);
  return written;
}

bool isOwnProc() {
  std::array<char, 16> number{};
  const ssize_t size = readlink("/proc/self", number.data(), number.size());
  return size > 0 &&
         std::string(number.data(), static_cast<std::size_t>(size)) == std::to_string(getpid());
}

/// Returns the identifier outside that nobody inside stands for, or -1.
long mapOne(const std::string& path, unsigned own) {
  const std::string inside = std::to_string(nobody) + ' ';
  // A map can be written once only, but a refused one does not count.
  if (own == 0 && writeTo(path, inside + std::to_string(nobody) + " 1")) return nobody;
  return writeTo(path, inside + std::to_string(own) + " 1") ? static_cast<long>(own) : -1;
}

}  // namespace

NamespaceChild forkIntoNamespaces(bool userNamespace) {
  for (const int flags : {CLONE_NEWUSER | CLONE_NEWPID, CLONE_NEWUSER, CLONE_NEWPID, 0}) {
    if (!userNamespace && (flags & CLONE_NEWUSER) != 0) continue;
    const pid_t child = forkSelf(static_cast<unsigned>(flags));
    if (child < 0) continue;
    return {.process = child,
            .newUserNamespace = (flags & CLONE_NEWUSER) != 0,
            .newPidNamespace = (flags & CLONE_NEWPID) != 0};
  }
  throw StartError(StartStep::startProcesses);
}

std::uint32_t mapIdentifiers(pid_t child) {
  // That of an outer process namespace has another process under this number.
  if (!isOwnProc()) return 0;
  const std::string process = "/proc/" + std::to_string(child);
  // Without this an unprivileged caller may not write a group map, because dropping a group can
  // also open what a group was meant to lock out.
  writeTo(process + "/setgroups", "deny");
  const long group = mapOne(process + "/gid_map", getegid());
  const long user = mapOne(process + "/uid_map", geteuid());
  if (group < 0 || user < 0) return 0;
  const bool root = group == 0 || user == 0;
  return layerUserNamespace | (root ? 0U : layerNotRoot);
}

std::uint32_t unshareNamespaces() {
  int all = 0;
  std::uint32_t layers = 0;
  for (const NamespaceRow& row : namespaceRows) {
    all |= row.flag;
    layers |= row.layer;
  }
  if (unshare(all) == 0) return layers;
  layers = 0;
  for (const NamespaceRow& row : namespaceRows) {
    if (unshare(row.flag) == 0) layers |= row.layer;
  }
  return layers;
}

}  // namespace Keelgate::Sandbox
