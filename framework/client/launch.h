// SPDX-License-Identifier: Apache-2.0
/// Where a service comes from: a process of our own, or the socket of an activated one.
///
/// A launcher is looked after by its pidfd and never by its number, which the kernel may give to
/// another process as soon as somebody has waited for this one.
#pragma once

#include "framework/client/deadline.h"
#include "framework/client/descriptor.h"

#include <keelgate/errors.h>
#include <keelgate/values.h>

#include <string_view>

namespace Keelgate {

/// Why there is no service (startFailed). The description says what to do about it.
struct StartFailure : HostError {
  StartFailure(String sentence, bool itMayPass)
      : HostError(Reason::startFailed, std::move(sentence)), mayPass(itMayPass) {}

  /// Another try may go better, as after a death; a missing file stays missing.
  bool mayPass;
};

/// What the system says of an errno.
String errorText(int error);

/// A failure that passes with the load on the process or the machine, and how to be rid of it.
/// `error` is the errno of the call that failed.
StartFailure shortage(std::string_view what, int error);

/// The client's ends of a service.
struct ServiceHandles {
  /// SOCK_SEQPACKET; its end is the service's end.
  Descriptor control;
  /// The pidfd of the launcher; none for an activated service.
  Descriptor launcher;
};

/// Starts the program that locateService finds. It gets an empty environment, its own session and
/// nothing but descriptor 3. Throws StartFailure. Callable from any thread. Not waited for: whether
/// it works is for the handshake to tell.
ServiceHandles launchService(const String& path, DescriptorRegistry& registry);

/// By pidfd, so that no other process can be meant.
void signalLauncher(const Descriptor& launcher, int signal) noexcept;
/// Takes note of a launcher that has ended. The application may have waited for it already, or have
/// told the kernel that nobody will.
void reapLauncher(const Descriptor& launcher) noexcept;

/// Connects to an activated service, on whose socket root, the caller or `socketUser` listens.
/// Throws StartFailure. Callable from any thread. Does not wait.
ServiceHandles connectService(const String& socket, Optional<unsigned> socketUser,
                              DescriptorRegistry& registry);

}  // namespace Keelgate
