// SPDX-License-Identifier: Apache-2.0
/// What a service process does before it touches its server. Called on the main thread, once.
#pragma once

namespace Keelgate {

/// Binds what the language's runtime calls back in this process: a fault that nobody catches ends
/// the process on the spot. The runtime's own handler would first write to a standard error that a
/// sealed process does not have.
void register_for_dlsym_callbacks() noexcept;

/// The two switches of the preferences layer. There is no way back: a process that has started to
/// handle strangers' messages must not become able to write preferences again.
class Preferences {
 public:
  static void setDirectMode(int on) noexcept;
  static void setReadOnly(int on) noexcept;

  [[nodiscard]] static bool isDirectMode() noexcept;
  [[nodiscard]] static bool isReadOnly() noexcept;
};

}  // namespace Keelgate
