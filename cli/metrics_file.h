// SPDX-License-Identifier: Apache-2.0
/// The counters of a run in a file that a collector reads, of which it never sees a half.
#pragma once

#include "cli/console.h"
#include "cli/tally.h"

#include <keelgate/values.h>

#include <chrono>

namespace Keelgate::CLI {

/// For one thread. What it refers to must outlive it.
class MetricsFile {
 public:
  /// An empty path stands for no file. Writes the first version at once, before a service is
  /// started; throws std::system_error where that cannot be done.
  MetricsFile(String path, const Tally& tally, Console& console);
  /// Writes the last version.
  ~MetricsFile();
  MetricsFile(const MetricsFile&) = delete;
  MetricsFile& operator=(const MetricsFile&) = delete;

  /// How long the file may stay as it is, in milliseconds, as poll has it.
  [[nodiscard]] int interval() const;
  /// Writes the file when that time is over.
  void update();

 private:
  void write();
  void tryToWrite() noexcept;

  const String path_;
  const Tally& tally_;
  Console& console_;
  std::chrono::steady_clock::time_point next_;
  /// Said once; the counters go on.
  Bool failed_ = false;
};

}  // namespace Keelgate::CLI
