// SPDX-License-Identifier: Apache-2.0
#include "program/service/start_up.h"

int main() {
  return VespKeelgateService::startUp();
}
