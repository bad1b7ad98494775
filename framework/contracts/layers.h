// SPDX-License-Identifier: Apache-2.0
/// The layers of a worker's isolation: the service reports which it has, the client says by name
/// which are missing.
///
/// Pure functions and constants: callable from any thread.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace Keelgate {

/// A report is the sum of the bits of the layers that are there.
enum Layer : std::uint32_t {
  /// Required: never missing in a service that said it was ready.
  layerStrictFilter = 1u << 0,
  layerOneDescriptor = 1u << 1,
  layerNoNewPrivileges = 1u << 2,
  layerNoCapabilities = 1u << 3,
  layerLimits = 1u << 4,
  layerNotDumpable = 1u << 5,
  /// Optional: a machine may lack them.
  layerUserNamespace = 1u << 8,
  layerPidNamespace = 1u << 9,
  layerMountNamespace = 1u << 10,
  layerNetworkNamespace = 1u << 11,
  layerIpcNamespace = 1u << 12,
  layerUtsNamespace = 1u << 13,
  layerCgroupNamespace = 1u << 14,
  layerEmptyRoot = 1u << 15,
  layerLandlock = 1u << 16,
  layerNotRoot = 1u << 17,
  layerNoSupplementaryGroups = 1u << 18,
};

/// The text lives as long as the program.
struct NamedLayer {
  Layer layer;
  std::string_view name;
};

/// Strongest first: the required layers, then the optional ones that a client may insist on. The
/// last rows are neither: an unprivileged caller brings groups that it cannot leave, and behind
/// the other layers they open nothing.
inline constexpr std::array namedLayers{
    NamedLayer{layerStrictFilter, "strict system call filter"},
    NamedLayer{layerOneDescriptor, "one descriptor"},
    NamedLayer{layerNoNewPrivileges, "no new privileges"},
    NamedLayer{layerNoCapabilities, "no capabilities"},
    NamedLayer{layerLimits, "resource limits"},
    NamedLayer{layerNotDumpable, "not dumpable"},
    NamedLayer{layerUserNamespace, "user namespace"},
    NamedLayer{layerMountNamespace, "mount namespace"},
    NamedLayer{layerEmptyRoot, "empty root directory"},
    NamedLayer{layerNetworkNamespace, "network namespace"},
    NamedLayer{layerPidNamespace, "process namespace"},
    NamedLayer{layerIpcNamespace, "IPC namespace"},
    NamedLayer{layerUtsNamespace, "host name namespace"},
    NamedLayer{layerCgroupNamespace, "cgroup namespace"},
    NamedLayer{layerLandlock, "Landlock"},
    NamedLayer{layerNotRoot, "not the root user"},
    NamedLayer{layerNoSupplementaryGroups, "no supplementary groups"},
};
constexpr std::size_t requiredLayerCount = 6;
constexpr std::size_t optionalLayerCount = 9;

/// The bits of the required layers.
constexpr std::uint32_t requiredLayers = [] {
  std::uint32_t bits = 0;
  for (std::size_t i = 0; i < requiredLayerCount; ++i) bits |= namedLayers[i].layer;
  return bits;
}();

/// One line for the log that names the optional layers which `layers` lacks; empty when none is
/// missing. It ends without a full stop, so that a sentence can go on from it.
std::string missingLayersLine(std::uint64_t layers);

}  // namespace Keelgate
