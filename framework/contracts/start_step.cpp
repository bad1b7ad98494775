// SPDX-License-Identifier: Apache-2.0
/// Every sentence says what to change, because whoever reads it has a machine in front of them
/// where nothing starts.
#include "framework/contracts/start_step.h"

#include <string_view>
#include <system_error>

namespace Keelgate {

namespace {

std::string_view sentence(StartStep step) {
  switch (step) {
    case StartStep::readFrame:
      return "The service does not understand its client: install both from one build";
    case StartStep::closeDescriptors:
      return "The service could not close the descriptors that it inherited: allow close_range or "
             "close in the profile that it is started under";
    case StartStep::startProcesses:
      return "The service could not start its processes: raise the process limit (ulimit -u, or "
             "pids.max of the control group)";
    case StartStep::watchProcesses:
      return "The service could not watch its processes: allow prctl(PR_SET_PDEATHSIG), signalfd4 "
             "and pipe2 in the profile that it is started under, or raise the limit of open files "
             "(ulimit -n)";
    case StartStep::renounceNewPrivileges:
      return "The service could not renounce new privileges: allow prctl(PR_SET_NO_NEW_PRIVS) in "
             "the profile that it is started under";
    case StartStep::dropCapabilities:
      return "The service could not give up its capabilities: allow prctl and capset in the "
             "profile that it is started under";
    case StartStep::becomeUndumpable:
      return "The service could not make itself undumpable: allow prctl(PR_SET_DUMPABLE) in the "
             "profile that it is started under";
    case StartStep::lowerLimits:
      return "The service could not lower its resource limits: allow prlimit64 in the profile that "
             "it is started under";
    case StartStep::reserveHeap:
      return "The service could not reserve its heap: raise the address space limit (ulimit -v, "
             "ulimit -d, or vm.overcommit_memory)";
    case StartStep::loadFilter:
      return "The kernel refused the system call filter: use a kernel with CONFIG_SECCOMP_FILTER "
             "and allow seccomp in the profile that the service is started under";
    case StartStep::checkStack:
      return "The service has too little stack for the deepest messages: raise the hard limit to "
             "8 MiB (ulimit -H -s)";
    case StartStep::proveFilter:
      return "The seal did not hold when the service tried it: run it on a kernel that enforces "
             "seccomp filters, not under an emulation of one";
  }
  return "The service gave a reason that its client does not know: install both from one build";
}

}  // namespace

std::string startFailureSentence(StartStep step, int error) {
  std::string text(sentence(step));
  if (error != 0) text += " (" + std::generic_category().message(error) + ")";
  return text;
}

}  // namespace Keelgate
