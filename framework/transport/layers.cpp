// SPDX-License-Identifier: Apache-2.0
/// Every sentence says what to change, because whoever reads it has a machine in front of them
/// where nothing starts.
#include "framework/transport/layers.h"

#include <span>
#include <system_error>

namespace Keelgate::Transport {

namespace {

std::string_view explain(Obstacle obstacle) {
  switch (obstacle) {
    case Obstacle::badFrame:
      return "The service does not understand its client: install both from one build";
    case Obstacle::descriptors:
      return "The service could not close the descriptors that it inherited: allow close_range or "
             "close in the profile that it is started under";
    case Obstacle::process:
      return "The service could not start its processes: raise the process limit (ulimit -u, or "
             "pids.max of the control group)";
    case Obstacle::watch:
      return "The service could not watch its processes: allow prctl(PR_SET_PDEATHSIG), signalfd4 "
             "and pipe2 in the profile that it is started under, or raise the limit of open files "
             "(ulimit -n)";
    case Obstacle::noNewPrivileges:
      return "The service could not renounce new privileges: allow prctl(PR_SET_NO_NEW_PRIVS) in "
             "the profile that it is started under";
    case Obstacle::capabilities:
      return "The service could not give up its capabilities: allow prctl and capset in the "
             "profile that it is started under";
    case Obstacle::dumpable:
      return "The service could not make itself undumpable: allow prctl(PR_SET_DUMPABLE) in the "
             "profile that it is started under";
    case Obstacle::limits:
      return "The service could not lower its resource limits: allow prlimit64 in the profile that "
             "it is started under";
    case Obstacle::heap:
      return "The service could not reserve its heap: raise the address space limit (ulimit -v, "
             "ulimit -d, or vm.overcommit_memory)";
    case Obstacle::filter:
      return "The kernel refused the system call filter: use a kernel with CONFIG_SECCOMP_FILTER "
             "and allow seccomp in the profile that the service is started under";
    case Obstacle::stack:
      return "The service has too little stack for the deepest messages: raise the hard limit to "
             "8 MiB (ulimit -H -s)";
    case Obstacle::selfCheck:
      return "The seal did not hold when the service tried it: run it on a kernel that enforces "
             "seccomp filters, not under an emulation of one";
  }
  return "The service gave a reason that its client does not know: install both from one build";
}

}  // namespace

std::string missingLayersLine(std::uint64_t layers) {
  std::string line;
  // The first walls are not asked about: without one of them there is no service to report.
  for (const NamedLayer& row : std::span(namedLayers).subspan(firstWalls, secondWalls)) {
    if ((layers & row.layer) != 0) continue;
    line += line.empty() ? "Running without: " : ", ";
    line += row.name;
  }
  return line;
}

std::uint64_t ownVersion() noexcept {
  return KEELGATE_VERSION_NUMBER;
}

std::string versionText(std::uint64_t version) {
  const auto part = [version](unsigned bits) {
    return std::to_string((version >> bits) & 0xffff);
  };
  return part(32) + '.' + part(16) + '.' + part(0);
}

std::string sentence(Obstacle obstacle, int error) {
  std::string text(explain(obstacle));
  if (error != 0) text += " (" + std::generic_category().message(error) + ")";
  return text;
}

}  // namespace Keelgate::Transport
