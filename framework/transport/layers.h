// SPDX-License-Identifier: Apache-2.0
/// The walls around a worker by name, and why a service refuses to start, for people to read.
///
/// Pure functions and constants: callable from any thread.
#pragma once

#include "framework/transport/frames.h"

#include <array>
#include <string>
#include <string_view>

namespace Keelgate::Transport {

/// A layer, and what people call it. The texts live as long as the program.
struct NamedLayer {
  Layer layer;
  std::string_view name;
};

/// Strongest first. The first walls are never missing in a service that is ready; the second ones
/// are what a machine may lack and a client may insist on. The last rows are neither: an
/// unprivileged caller brings groups that it cannot leave, and behind the other walls they open
/// nothing.
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
/// How many rows from the beginning; the second walls follow them.
constexpr std::size_t firstWalls = 6;
constexpr std::size_t secondWalls = 9;

/// One line for the log that names the second walls which `layers` lacks; empty when none is
/// missing. It ends without a full stop, so that a sentence can go on from it.
std::string missingLayersLine(std::uint64_t layers);

/// Of this build, as a ready frame carries it: 16 bits each for major, minor and patch.
std::uint64_t ownVersion() noexcept;
/// "1.2.3" from such a number.
std::string versionText(std::uint64_t version);

/// A sentence that says what a service could not have and how to get it. `error` is the errno that
/// came with it, or 0. An obstacle that is none, from a service of another build, has one too.
std::string sentence(Obstacle obstacle, int error);

}  // namespace Keelgate::Transport
