// SPDX-License-Identifier: Apache-2.0
/// Namespaces: a taken-over worker has no network, no other process, no host name to read.
///
/// They are paid for once, by the zygote. Each can be missing on its own: a container's profile
/// forbids all of them, a system may have switched off user namespaces alone, and a security module
/// may grant one and then refuse what it is for. So each step is tried and reported by itself.
#pragma once

#include <sys/types.h>
#include <cstdint>

namespace Keelgate::Sandbox {

/// The identifier that the service has inside its user namespace, and outside of it too where the
/// caller may choose: nobody's.
constexpr unsigned nobody = 65534;

/// A process that was forked into namespaces, and which of them it is in.
struct NamespaceChild {
  /// 0 in the child itself, as fork has it.
  pid_t process;
  bool newUserNamespace;
  bool newPidNamespace;
};

/// Forks a child into a new user and a new process namespace, or into as many of the two as the
/// machine gives; without `userNamespace` none of that kind. Throws StartError when not even a
/// plain fork succeeds. Single-threaded callers only.
NamespaceChild forkIntoNamespaces(bool userNamespace);

/// Maps `nobody` of the child's user namespace to an unprivileged user outside: where the caller is
/// root to nobody, so that a worker which breaks out of everything owns nothing, otherwise to the
/// caller. Returns the layers that this gave: the namespace itself, and not being root.
std::uint32_t mapIdentifiers(pid_t child);

/// Leaves the other namespaces, all of them or each that it can, and returns their layers.
std::uint32_t unshareNamespaces();

}  // namespace Keelgate::Sandbox
