// SPDX-License-Identifier: Apache-2.0
#include "framework/contracts/process.h"

#include <atomic>
#include <exception>

namespace Keelgate {

namespace {
std::atomic<bool> directMode = false;
std::atomic<bool> readOnly = false;
}  // namespace

void register_for_dlsym_callbacks() noexcept {
  std::set_terminate([] { __builtin_trap(); });
}

void Preferences::setDirectMode(int on) noexcept {
  if (on != 0) directMode = true;
}
void Preferences::setReadOnly(int on) noexcept {
  if (on != 0) readOnly = true;
}
bool Preferences::isDirectMode() noexcept {
  return directMode;
}
bool Preferences::isReadOnly() noexcept {
  return readOnly;
}

}  // namespace Keelgate
