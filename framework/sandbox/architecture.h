// SPDX-License-Identifier: Apache-2.0
/// What a filter must know of the architecture that it is built for. Everything else about system
/// calls comes from the kernel's own names: the tables use none that only some architectures have.
#pragma once

#include <linux/audit.h>
#include <bit>

namespace Keelgate::Sandbox {

/// The calling convention that is let in. Each architecture has others with numbers of their own:
/// `int 0x80` on x86-64, 32-bit programs on arm64.
#if defined __x86_64__
inline constexpr unsigned nativeCalls = AUDIT_ARCH_X86_64;
#elif defined __aarch64__
inline constexpr unsigned nativeCalls = AUDIT_ARCH_AARCH64;
#elif defined KEELGATE_UNSEALED
// For tests of what reads messages, on machines of any kind.
inline constexpr unsigned nativeCalls = 0;
#else
#error "A filter is proven for each architecture; so far for x86-64 and arm64."
#endif

#ifndef KEELGATE_UNSEALED
/// A filter reads the half of an argument that comes first in memory.
static_assert(std::endian::native == std::endian::little);
#endif

}  // namespace Keelgate::Sandbox
