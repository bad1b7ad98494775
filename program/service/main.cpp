// SPDX-License-Identifier: Apache-2.0
#include "program/service/start_up.h"

// Deliberate: it takes no arguments. There is nothing that a caller could switch off.
int main() {
  return VespKeelgateService::startUp<>();
}
