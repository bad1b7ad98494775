// SPDX-License-Identifier: Apache-2.0
/// The sandbox's part in rewinding workers: what a zygote has to prepare for it before it is
/// sealed, and how a worker gives itself into the hands of its zygote before it has read anything.
///
/// A worker does that by itself. It asks to be traced, opens its own memory and the list of its
/// pages, and sends the descriptors: the zygote opens nothing and needs no right to anybody's
/// memory but through what it is given.
///
/// For single-threaded processes.
#pragma once

#include <linux/userfaultfd.h>

#include <fcntl.h>
#include <array>
#include <cstddef>
#include <cstdint>

namespace Keelgate::Sandbox {

/// The zygote's: a list of the processes of its namespace, and the two ends of the channel on which
/// its workers hand over. By fixed numbers, which filters know.
constexpr int processesDescriptor = 10;
constexpr int handoverReceiver = 11;
constexpr int handoverSender = 12;

/// What a worker calls exit_group with when it waits for a channel. A number that nobody who waits
/// for it could tell from 0.
constexpr unsigned waitingStatus = 256;

constexpr unsigned trackingFlags = O_CLOEXEC | UFFD_USER_MODE_ONLY;

/// Memory that a worker can write to.
struct WritableArea {
  std::uint64_t begin;
  std::uint64_t end;
};

/// What a worker says of itself when it hands over. The stack comes first.
struct WorkerAreas {
  std::size_t count;
  std::array<WritableArea, 15> areas;
};

/// What comes along with it, in this order.
enum HandedOver : std::size_t { handedTracking, handedMemory, handedPages, handedNotices };
constexpr std::size_t handedCount = 4;

/// In a zygote that has namespaces of its own and its old root still. False where the machine does
/// not give what it takes; nothing was lost then.
bool prepareRewinding();

/// Before the filter: takes back what was prepared.
void abandonRewinding();

/// In a zygote that has been prepared, for good: it is one that can fork alone.
void renounceRewinding();

/// In a new worker, before it has closed anything. Throws StartError.
void handOver();

/// In a worker that is sealed and has handed over: waits until it is given a channel. Each time
/// that the worker ends it is rewound to this call.
void awaitChannel();

}  // namespace Keelgate::Sandbox
