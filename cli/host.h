// SPDX-License-Identifier: Apache-2.0
/// What the subcommands that start a service share.
#pragma once

#include "cli/console.h"
#include "cli/reply.h"

#include <keelgate/client.h>

#include <cstddef>

namespace Keelgate::CLI {

/// The options with the service's log on the console, which must outlive the client.
Client::Options loggingTo(Console& console, Client::Options options);

/// One thread for each of the service's processes, so that none of them is idle.
std::size_t threadsFor(const Client::Options& options);

/// The exit status that an outcome asks for, where a rejection counts as one.
Status statusOf(Verdict verdict);

}  // namespace Keelgate::CLI
