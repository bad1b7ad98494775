// SPDX-License-Identifier: Apache-2.0
/// The service, with a zygote that sets its workers back.
#include "bench/rewind/rewinding_zygote.h"
#include "program/service/start_up.h"

int main() {
  return VespKeelgateService::startUp<Keelgate::Rewind::RewindingServer>();
}
