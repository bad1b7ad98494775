// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/steps.h"

#include "framework/contracts/start_step.h"
#include "framework/sandbox/namespaces.h"

#include <grp.h>
#include <linux/capability.h>
#include <linux/securebits.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <algorithm>
#include <array>
#include <vector>

namespace Keelgate::Sandbox {

void renounceNewPrivileges() {
  if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0)
    throw StartError(StartStep::renounceNewPrivileges);
}

bool leaveGroups() {
  if (setgroups(0, nullptr) == 0) return true;
  const int count = getgroups(0, nullptr);
  if (count < 0) return false;
  std::vector<gid_t> groups(static_cast<std::size_t>(count));
  if (getgroups(count, groups.data()) != count) return false;
  return std::all_of(groups.begin(), groups.end(), [](gid_t id) { return id == getegid(); });
}

bool becomeNobody() {
  return setresgid(nobody, nobody, nobody) == 0 && setresuid(nobody, nobody, nobody) == 0;
}

void dropCapabilities() {
  // Until the kernel knows no further capability.
  for (unsigned long bit = 0; prctl(PR_CAPBSET_DROP, bit, 0, 0, 0) == 0; ++bit) continue;
  prctl(PR_SET_SECUREBITS,
        SECBIT_NOROOT | SECBIT_NOROOT_LOCKED | SECBIT_NO_SETUID_FIXUP |
            SECBIT_NO_SETUID_FIXUP_LOCKED | SECBIT_KEEP_CAPS_LOCKED | SECBIT_NO_CAP_AMBIENT_RAISE |
            SECBIT_NO_CAP_AMBIENT_RAISE_LOCKED,
        0, 0, 0);
  // A set that is already empty needs no call, and the ambient set cannot exceed the others.
  __user_cap_header_struct header{.version = _LINUX_CAPABILITY_VERSION_3, .pid = 0};
  std::array<__user_cap_data_struct, _LINUX_CAPABILITY_U32S_3> sets{};
  syscall(SYS_capset, &header, sets.data());
  if (syscall(SYS_capget, &header, sets.data()) != 0) throw StartError(StartStep::dropCapabilities);
  for (const __user_cap_data_struct& half : sets) {
    if ((half.effective | half.permitted | half.inheritable) != 0) {
      throw StartError(StartStep::dropCapabilities, 0);
    }
  }
}

void becomeUndumpable() {
  if (prctl(PR_SET_DUMPABLE, 0, 0, 0, 0) != 0 || prctl(PR_GET_DUMPABLE, 0, 0, 0, 0) != 0) {
    throw StartError(StartStep::becomeUndumpable);
  }
}

}  // namespace Keelgate::Sandbox
