// SPDX-License-Identifier: Apache-2.0
/// The process-wide switches. Atomic, because they may be asked from any thread once it serves.
#include "framework/contracts/process.h"

#include <atomic>
#include <exception>

namespace Keelgate {

namespace {
std::atomic<bool> directMode = false;
std::atomic<bool> readOnly = false;
}  // namespace

void register_for_dlsym_callbacks() noexcept {
  // A trap and not abort(), which sends a signal by system calls that a sealed worker does not
  // have: it would die of the filter, and its wait status would name the wrong cause.
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
