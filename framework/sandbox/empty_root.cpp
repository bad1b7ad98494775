// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/steps.h"

#include <sys/mount.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <initializer_list>

namespace Keelgate::Sandbox {

namespace {

/// The new root needs some directory to be mounted on for a moment, and these are the ones that
/// even a container without a distribution has.
const char* mountEmpty() {
  constexpr unsigned long flags = MS_RDONLY | MS_NOSUID | MS_NODEV | MS_NOEXEC;
  for (const char* place : {"/tmp", "/proc", "/dev"}) {
    if (mount("none", place, "tmpfs", flags, "size=4k,nr_inodes=1,mode=0555") == 0) return place;
  }
  return nullptr;
}

}  // namespace

bool enterEmptyRoot() {
  // Before anything is mounted: what is mounted on a shared tree would appear outside too.
  if (mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) return false;
  const char* const place = mountEmpty();
  if (place == nullptr || chdir(place) != 0) return false;
  // Both roots on one directory: the old one lies on the new one and is taken off, so that the new
  // one needs no directory of its own for it.
  if (syscall(SYS_pivot_root, ".", ".") != 0) return false;
  return umount2(".", MNT_DETACH) == 0 && chdir("/") == 0;
}

}  // namespace Keelgate::Sandbox
