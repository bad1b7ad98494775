// SPDX-License-Identifier: Apache-2.0
/// How much memory a message is worth. The service lays out its workers by it and the client reads
/// replies by it, so that neither can be made to take more than the message's length justifies.
#pragma once

#include <cstddef>
#include <cstdint>

namespace Keelgate {

/// Workers that are forked before their message is there are forked for messages up to this many
/// bytes. What is longer takes so long to read that the wait for a worker of its own is lost in it.
constexpr std::uint64_t shortMessage = std::uint64_t{256} << 10;

/// Bytes that every message may take, whatever its length: the program's own needs and the
/// allocator's slack are far below. Untouched, they cost nothing.
constexpr std::size_t budgetBase = std::size_t{128} << 20;

/// Bytes for each byte of the message. The hungriest message is a list of empty payloads: some 4 KB
/// for the record of each, as against 45 bytes of XML or a dozen of binary. A longer list than the
/// base has room for, 26,000 at least, would not be a push payload any more, and to grant its
/// factor would let 64 MiB of message ask for the whole machine.
constexpr std::size_t budgetPerByte = 64;

/// Bytes of memory that a message of `length` bytes is worth: resident, in the worker that decodes
/// it, and once more in the client for the record.
constexpr std::size_t memoryBudget(std::uint64_t length) {
  return budgetBase + budgetPerByte * static_cast<std::size_t>(length);
}

/// What a worker needs beside its heap: the program, a stack for the deepest message, and what the
/// zygote has allocated.
constexpr std::size_t processShare = std::size_t{12} << 20;

/// Bytes of heap of a worker for messages of up to `length` bytes.
constexpr std::size_t heapFor(std::uint64_t length) {
  return memoryBudget(length) - processShare;
}

/// Bytes that may be allocated at a time for a message of `length` bytes. The rest of the heap is
/// for the gaps between blocks, so that this limit is met first, in every worker at the same point.
constexpr std::size_t allocationLimit(std::uint64_t length) {
  return heapFor(length) / 16 * 15;
}

}  // namespace Keelgate
