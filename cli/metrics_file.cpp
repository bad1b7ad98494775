// SPDX-License-Identifier: Apache-2.0
#include "cli/metrics_file.h"

#include "cli/files.h"

#include <fmt/format.h>

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <new>
#include <system_error>
#include <utility>

namespace Keelgate::CLI {

namespace {

using std::chrono::steady_clock;

/// Collectors look every few seconds at most.
constexpr std::chrono::milliseconds betweenVersions{1000};

[[noreturn]] void fail(const String& path) {
  throw std::system_error(errno, std::generic_category(), path);
}

}  // namespace

MetricsFile::MetricsFile(String path, const Tally& tally, Console& console)
    : path_(std::move(path)), tally_(tally), console_(console) {
  if (!path_.empty()) write();
}

MetricsFile::~MetricsFile() {
  if (!path_.empty()) tryToWrite();
}

int MetricsFile::interval() const {
  return path_.empty() ? -1 : static_cast<int>(betweenVersions.count());
}

void MetricsFile::update() {
  if (!path_.empty() && steady_clock::now() >= next_) tryToWrite();
}

void MetricsFile::write() {
  // Beside the file, so that taking its place is a step that a reader never sees half of.
  const String draft = fmt::format("{}.{}", path_, getpid());
  const int file = open(draft.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, 0644);
  if (file < 0) fail(draft);
  try {
    writeAll(file, tally_.metrics());
  } catch (...) {
    close(file);
    unlink(draft.c_str());
    throw;
  }
  // A full disk may show only here.
  if (close(file) != 0 || rename(draft.c_str(), path_.c_str()) != 0) {
    const int error = errno;
    unlink(draft.c_str());
    errno = error;
    fail(path_);
  }
  next_ = steady_clock::now() + betweenVersions;
}

void MetricsFile::tryToWrite() noexcept try { write(); } catch (const std::exception& error) {
  next_ = steady_clock::now() + betweenVersions;
  if (std::exchange(failed_, true)) return;
  try {
    console_.complain(fmt::format("--metrics: {}", error.what()));
  } catch (const std::bad_alloc&) {
    // Neither the file nor the word about it is worth a message.
  }
}

}  // namespace Keelgate::CLI
