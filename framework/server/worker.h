// SPDX-License-Identifier: Apache-2.0
/// The worker: the process that reads a stranger's message. It is thrown away afterwards.
#pragma once

#include "framework/sandbox/seal.h"
#include "framework/server/keelgate_server.h"

#include <cstdint>

namespace Keelgate {

/// Seals the process, answers at most so many messages, and exits. Called in a fresh fork of the
/// zygote, which inherits all that it is told: a worker asks nobody for anything.
[[noreturn]] void work(const KeelgateServer& server, std::uint64_t messages,
                       const Sandbox::WorkerSeal& seal);

}  // namespace Keelgate
