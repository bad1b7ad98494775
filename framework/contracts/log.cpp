// SPDX-License-Identifier: Apache-2.0
/// Where lines of the log go: to the thread's capture, or to standard error.
#include "framework/contracts/log.h"

#include <cstdio>

namespace Keelgate {

namespace {
/// Of each thread: what one message logs never stands in the reply to another.
thread_local LogCapture* capture = nullptr;
}  // namespace

LogCapture::LogCapture() {
  capture = this;
}
LogCapture::~LogCapture() {
  capture = nullptr;
}

// A member on purpose, though it needs no state: lines are logged *on* the handle.
// NOLINTNEXTLINE(readability-convert-member-functions-to-static)
void LogHandle::error(std::string_view format, std::string_view argument) const {
  String line(format);
  // Put in as it is and once: a "%@" in the argument is text.
  if (const std::size_t at = line.find("%@"); at != String::npos) line.replace(at, 2, argument);
  if (capture != nullptr) {
    capture->lines.push_back(std::move(line));
    return;
  }
  line += '\n';
  std::fwrite(line.data(), 1, line.size(), stderr);
}

}  // namespace Keelgate
