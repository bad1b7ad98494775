// SPDX-License-Identifier: Apache-2.0
/// What a step of the seal throws when a wall cannot be built that no service runs without.
#pragma once

#include "framework/transport/frames.h"

#include <cerrno>
#include <exception>

namespace Keelgate::Sandbox {

/// Ends the service before it says that it is ready; the client is told the obstacle.
class Refusal : public std::exception {
 public:
  /// `error` is the errno that came with it, or 0.
  explicit Refusal(Transport::Obstacle obstacle, int error = errno)
      : obstacle_(obstacle), error_(error) {}

  [[nodiscard]] Transport::Obstacle obstacle() const noexcept { return obstacle_; }
  [[nodiscard]] int error() const noexcept { return error_; }
  [[nodiscard]] const char* what() const noexcept override { return "the seal is incomplete"; }

 private:
  Transport::Obstacle obstacle_;
  int error_;
};

}  // namespace Keelgate::Sandbox
