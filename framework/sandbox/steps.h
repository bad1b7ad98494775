// SPDX-License-Identifier: Apache-2.0
/// The steps that the seal is made of, as far as nobody else takes them. Each has a source of its
/// own.
///
/// For single-threaded processes: the calls speak for the calling thread alone, and another thread
/// could undo what one has done.
#pragma once

#include <cstddef>
#include <cstdint>

namespace Keelgate::Sandbox {

// ------------------------------------------------------------------------------ launcher.cpp

// The launcher is the process that the client started. It stays behind, outside of the sandbox,
// because somebody there has to write the maps of a user namespace, and because the client needs a
// child of its own to watch and to kill.

/// What a zygote begins with.
struct ZygoteStart {
  /// The layers (Layer) that its launcher gave it.
  std::uint32_t layers;
  /// Hangs up when the launcher dies.
  int launcher;
};

/// Forks the zygote into namespaces of its own and returns in it. The calling process becomes its
/// launcher: it ends as the zygote ends, and by SIGTERM with all that it started. Throws
/// StartError, in either process.
ZygoteStart startZygote();

// --------------------------------------------------------------------------- descriptors.cpp

/// Closes every descriptor of the process but `kept`, and makes it the service's descriptor; all of
/// them where that is -1. A worker has exactly one, so that there is nothing else to read from or
/// write to. Throws StartError when it cannot.
void keepOnly(int kept);

// ---------------------------------------------------------------------------- empty_root.cpp

/// Puts the process, which must be in a mount namespace of its own, on an empty read-only root and
/// lets go of the old one: no file to read, execute or fill, even for one who gets past the filter.
/// False when the machine does not let it; nothing was lost then.
bool enterEmptyRoot();

// ------------------------------------------------------------------------------ landlock.cpp

/// The second lock on files, ports, abstract sockets and signals. Unlike namespaces it needs no
/// privilege, so that it stands where a container forbids them.
///
/// Gives up every right that the running kernel's Landlock knows, for this process and all that it
/// forks; no_new_privs must be set. With a directory all but to read and write the files in it.
/// False where there is no Landlock or it refuses.
bool renounceByLandlock(int butFor = -1);

// --------------------------------------------------------------------------- credentials.cpp

// Who the service is: nobody, with no group, no capability, and no way to gain one.

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

// ---------------------------------------------------------------------------------- heap.cpp

// The heap of a worker: all of it is there before the first byte from outside is read, and no more
// comes. That of a short message is mapped once, in the zygote, and copied by each fork; as long
// as nobody writes to it that costs nothing.
//
// It lies in a mapping that the kernel places, and begins at a random point of it. The area that
// the C library grows by itself, next to where a static program ends, has 18 bits of randomness:
// a message that fills a few megabytes would find its own bytes at an address that it can guess.

/// The zygote's part, before its filter: settings of the allocator and the one-time work of the
/// exception runtime, whose system call a sealed worker could not make. Throws StartError.
void prepareHeap();

/// The zygote's part, under its filter, which gives no memory next to the program any more: takes
/// what is left there, so that nothing of it is ever handed out to a message.
void abandonFirstHeap();

/// The zygote's part, under its filter, for the heap of a short message, and that of a worker that
/// needs more: maps a heap of so many bytes, or of the half, a quarter and so on, where the machine
/// has not that much: most messages need little of what they may have. Throws StartError when not
/// even the heap of an empty message is to be had.
void reserveHeap(std::size_t bytes);

// --------------------------------------------------------------------------------- pages.cpp

/// Has the pages mapped that a message is going to need: a fork starts without its parent's mapping
/// of the program, and with its data to be copied at the first write. Of the 80 microseconds that a
/// fresh worker took to answer a short message, 70 went there.
void touchPages() noexcept;

}  // namespace Keelgate::Sandbox
