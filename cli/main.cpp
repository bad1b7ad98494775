// SPDX-License-Identifier: Apache-2.0
#include "cli/commands.h"

#include <sys/prctl.h>
#include <sys/resource.h>

#include <exception>

namespace Keelgate::CLI {

namespace {

/// The messages of many senders are in this process at a time: neither a core file nor a debugger
/// of the same user may have them.
void forbidDumps() {
  constexpr rlimit none{.rlim_cur = 0, .rlim_max = 0};
  // Where either fails, the other holds.
  setrlimit(RLIMIT_CORE, &none);
  prctl(PR_SET_DUMPABLE, 0);
}

Status keelgate(Array<String> words) {
  Console console;
  try {
    run(std::move(words), KEELGATE_VERSION, console);
    console.flush();
  } catch (const std::exception& error) {
    console.complain(error.what());
    // As a rule a HostError from the start of the service; whatever it was, no more is unpacked.
    console.note(Status::serviceLost);
  }
  return console.status();
}

}  // namespace

}  // namespace Keelgate::CLI

int main(int count, char** words) {
  Keelgate::CLI::forbidDumps();
  return static_cast<int>(Keelgate::CLI::keelgate({words + 1, words + count}));
}
