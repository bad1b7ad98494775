// SPDX-License-Identifier: Apache-2.0
/// Who the service is: nobody, with no group, no capability, and no way to gain one.
///
/// For single-threaded processes: the calls speak for the calling thread alone.
#pragma once

#include <cstdint>

namespace Keelgate::Sandbox {

/// Gives up what can be gained by executing a file. Throws StartError.
void renounceNewPrivileges();

/// Leaves all supplementary groups, which needs privilege and is impossible in a user namespace
/// whose maps are safe; so the launcher does it. True when none but the primary group is left.
bool leaveGroups();

/// Becomes nobody where the caller has the right to. False when the identifiers stay as they are.
bool becomeNobody();

/// Empties the capability sets, and closes the ways to refill them. The bounding set and the secure
/// bits need a capability to change; a process that never had it cannot use what they allow, thanks
/// to no_new_privs. Throws StartError when a set that counts is not empty afterwards.
void dropCapabilities();

/// Closes /proc/PID/mem and ptrace to others of the same user, and core dumps. Throws StartError.
void becomeUndumpable();

}  // namespace Keelgate::Sandbox
