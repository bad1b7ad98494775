// SPDX-License-Identifier: Apache-2.0
// Linked into every program of a build with faults in it. A file and not an environment variable:
// the service is started with an empty environment. Mapped before main, so that a sealed worker
// needs no call for it.
#include "scripts/mutation/switch.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdlib>

KeelgateFaults* keelgateFaults;

__attribute__((constructor(101))) static void mapFaults() {
  const int file = open(KEELGATE_FAULTS_FILE, O_RDWR | O_CLOEXEC);
  void* const memory =
      mmap(nullptr, KEELGATE_FAULTS_SIZE, PROT_READ | PROT_WRITE, MAP_SHARED, file, 0);
  if (memory == MAP_FAILED) std::abort();
  close(file);
  keelgateFaults = static_cast<KeelgateFaults*>(memory);
}
