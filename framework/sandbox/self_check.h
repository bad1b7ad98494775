// SPDX-License-Identifier: Apache-2.0
/// The last step before a service says that it is ready: it does not believe its own seal.
#pragma once

#include <linux/filter.h>
#include <span>

namespace Keelgate::Sandbox {

/// Seals a child of the calling process with the worker's filter and has it make a call that the
/// filter forbids and the zygote's own allows. An emulation of the kernel, or a kernel told to
/// ignore filters, accepts them and enforces nothing. Throws StartError when the child lives.
void proveFilter(std::span<const sock_filter> workerFilter);

}  // namespace Keelgate::Sandbox
