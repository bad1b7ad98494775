// SPDX-License-Identifier: Apache-2.0
/// What is true of every service process, and what it does before it touches its server. The
/// functions are called on the main thread, once.
#pragma once

namespace Keelgate {

/// The number of the channel in every process of the service: the first behind the standard
/// descriptors, which a service does not have.
constexpr int serviceDescriptor = 3;

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
