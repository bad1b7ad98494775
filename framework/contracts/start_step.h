// SPDX-License-Identifier: Apache-2.0
/// The steps of a service's start that it does not run without, and what to say when one fails.
///
/// Pure functions and values: callable from any thread.
#pragma once

#include <cerrno>
#include <cstdint>
#include <exception>
#include <string>

namespace Keelgate {

/// From 1, so that a frame of zeros names none. startFailureSentence has the text for each.
enum class StartStep : std::uint64_t {
  readFrame = 1,
  closeDescriptors,
  startProcesses,
  watchProcesses,
  renounceNewPrivileges,
  dropCapabilities,
  becomeUndumpable,
  lowerLimits,
  reserveHeap,
  loadFilter,
  proveFilter,
  checkStack,
};

/// A sentence that says what failed and how to mend it. `error` is the errno that came with it, or
/// 0. A step that this build does not know, from a service of another one, has a sentence too.
std::string startFailureSentence(StartStep step, int error);

/// Thrown where a step fails. It ends the service before it says that it is ready; the client is
/// told the step.
class StartError : public std::exception {
 public:
  /// `error` is the errno that came with it, or 0.
  explicit StartError(StartStep itsStep, int itsError = errno) : step(itsStep), error(itsError) {}
  [[nodiscard]] const char* what() const noexcept override { return "the service cannot start"; }

  StartStep step;
  int error;
};

}  // namespace Keelgate
