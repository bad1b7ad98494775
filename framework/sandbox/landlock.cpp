// SPDX-License-Identifier: Apache-2.0
#include "framework/sandbox/steps.h"

#include <linux/landlock.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <array>
#include <cstddef>
#include <cstdint>

namespace Keelgate::Sandbox {

namespace {

/// As the kernel takes it. Our own, because the system's header may be older than the kernel, and
/// a right that is not handled is a right that is granted.
struct Ruleset {
  std::uint64_t files;
  std::uint64_t network;
  std::uint64_t scoped;
};

/// What each interface number of Landlock added; the kernel refuses bits that it does not know.
struct AbiRow {
  std::uint32_t abi;
  std::size_t size;
  Ruleset handled;
};
constexpr std::uint64_t lowest(unsigned count) {
  return (std::uint64_t{1} << count) - 1;
}
constexpr std::array abiRows{
    AbiRow{6, 24, {lowest(16), lowest(2), lowest(2)}},  // abstract sockets and signals
    AbiRow{5, 16, {lowest(16), lowest(2), 0}},          // ioctl on devices
    AbiRow{4, 16, {lowest(15), lowest(2), 0}},          // TCP bind and connect
    AbiRow{3, 8, {lowest(15), 0, 0}},                   // truncate
    AbiRow{2, 8, {lowest(14), 0, 0}},                   // link and rename across directories
    AbiRow{1, 8, {lowest(13), 0, 0}},                   // the first 13 rights on files
};

}  // namespace

bool renounceByLandlock(int butFor) {
  const long abi =
      syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION);
  for (const AbiRow& row : abiRows) {
    if (abi < static_cast<long>(row.abi)) continue;
    const long ruleset = syscall(SYS_landlock_create_ruleset, &row.handled, row.size, 0);
    if (ruleset < 0) return false;
    const landlock_path_beneath_attr exception{
        .allowed_access = LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_WRITE_FILE,
        .parent_fd = butFor};
    // Where it cannot be had, what it is for fails.
    if (butFor >= 0) {
      syscall(SYS_landlock_add_rule, ruleset, LANDLOCK_RULE_PATH_BENEATH, &exception, 0);
    }
    const bool restricted = syscall(SYS_landlock_restrict_self, ruleset, 0) == 0;
    close(static_cast<int>(ruleset));
    return restricted;
  }
  return false;
}

}  // namespace Keelgate::Sandbox
