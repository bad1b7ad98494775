// SPDX-License-Identifier: Apache-2.0
#include "framework/client/service_location.h"

#include "framework/client/launch.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <link.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <memory>

namespace Keelgate {

namespace {

constexpr const char* serviceName = "VespKeelgateService";
/// As many as the kernel follows.
constexpr int maximumLinks = 40;

[[noreturn]] void fail(const String& sentence) {
  throw StartFailure(sentence, false);
}

[[noreturn]] void distrust(const String& program, const String& place, const String& why) {
  fail("The service " + program + " is not started: " + place + " " + why);
}

/// Throws unless nobody but root and the caller can change what is there.
void checkHands(const struct stat& status, const String& program, const String& place) {
  if (status.st_uid != 0 && status.st_uid != geteuid()) {
    distrust(program, place,
             "belongs to user " + std::to_string(status.st_uid) +
                 ", who could put another program there; it must belong to root or to user " +
                 std::to_string(geteuid()));
  }
  // The permissions of a link mean nothing, and a sticky folder protects what is in it.
  if (S_ISLNK(status.st_mode) || (S_ISDIR(status.st_mode) && (status.st_mode & S_ISVTX) != 0)) {
    return;
  }
  if ((status.st_mode & (S_IWGRP | S_IWOTH)) != 0) {
    distrust(program, place,
             "may be written by others than its owner, who could put another program there; take "
             "that away (chmod go-w " +
                 place + ")");
  }
}

/// One walk along a path, link by link as the kernel would follow it, with a look at each step.
class Walk {
 public:
  Walk(const String& program, DescriptorRegistry& registry)
      : program_(program), registry_(registry) {}

  Descriptor to(String rest) {
    enter(rest);
    for (int links = 0; !rest.empty();) {
      const String name = rest.substr(0, rest.find('/'));
      rest.erase(0, name.size() + 1);
      if (name.empty() || name == ".") continue;
      if (!step(name)) continue;
      if (++links > maximumLinks) fail("The service " + program_ + ": " + errorText(ELOOP));
      const String target = linkTarget();
      current_ = std::move(before_);
      rest = rest.empty() ? target : target + '/' + rest;
      if (target.starts_with('/')) enter(rest);
    }
    return std::move(current_);
  }

 private:
  /// The root directory, from which `rest` goes on.
  void enter(String& rest) {
    current_ = Descriptor();
    open(AT_FDCWD, "/");
    place_.clear();
    rest.erase(0, 1);
  }

  /// Whether what was stepped on is a link.
  bool step(const String& name) {
    before_ = std::move(current_);
    place_ += '/' + name;
    return S_ISLNK(open(before_.get(), name.c_str()).st_mode);
  }

  struct stat open(int folder, const char* name) {
    current_ = Descriptor(registry_, openat(folder, name, O_PATH | O_NOFOLLOW | O_CLOEXEC));
    struct stat status {};
    if (!current_ && (errno == EMFILE || errno == ENFILE || errno == ENOMEM)) {
      throw shortage("The service " + program_ + " could not be opened", errno);
    }
    if (!current_ || fstat(current_.get(), &status) != 0) {
      fail("The service " + program_ + " could not be started: " + errorText(errno) +
           "; it must be an executable file for this machine");
    }
    checkHands(status, program_, place_.empty() ? "/" : place_);
    return status;
  }

  [[nodiscard]] String linkTarget() const {
    std::array<char, 4096> text;
    const ssize_t n = readlinkat(current_.get(), "", text.data(), text.size());
    if (n <= 0) fail("The service " + program_ + ": " + errorText(errno));
    return {text.data(), static_cast<std::size_t>(n)};
  }

  const String& program_;
  DescriptorRegistry& registry_;
  Descriptor current_;
  Descriptor before_;
  /// How `current_` was reached, for sentences.
  String place_;
};

/// Of the library or program that this code is in; empty where nobody says.
String ownFolder() {
  Dl_info info;
  void* map;
  String whole;
  if (dladdr1(serviceName, &info, &map, RTLD_DL_LINKMAP) != 0) {
    whole = static_cast<link_map*>(map)->l_name;
  }
  // The main program has no name there. A relative one was relative to a folder that may have been
  // left since.
  if (whole.empty()) {
    std::error_code nowhere;
    whole = std::filesystem::read_symlink("/proc/self/exe", nowhere);
  }
  return whole.starts_with('/') ? whole.substr(0, whole.rfind('/') + 1) : String();
}

bool exists(const String& path) {
  return faccessat(AT_FDCWD, path.c_str(), F_OK, AT_EACCESS) == 0;
}

Array<String> places() {
  Array<String> folders;
  if (const String own = ownFolder(); !own.empty()) {
    for (const char* relative : {"", "../bin/"}) {
      // The mark of a build tree, where whatever is installed may be of another version.
      if (exists(own + relative + ".keelgate-build")) return {own + relative + serviceName};
    }
    for (const char* relative : {KEELGATE_SERVICE_FROM_LIBRARY, KEELGATE_SERVICE_FROM_PROGRAM}) {
      folders.push_back(own + relative + '/' + serviceName);
    }
  }
  folders.push_back(String(KEELGATE_SERVICE_FOLDER) + '/' + serviceName);
  return folders;
}

String findService() {
  String looked;
  for (const String& path : places()) {
    if (exists(path)) return path;
    looked += (looked.empty() ? "" : ", ") + path;
  }
  fail("There is no " + String(serviceName) + " at " + looked +
       ": install it there, or say where it is (servicePath, --service-path)");
}

/// The walk must begin at the root directory, whose owner is looked at too.
String absolute(const String& path) {
  if (path.starts_with('/')) return path;
  const std::unique_ptr<char, decltype(&std::free)> here(getcwd(nullptr, 0), &std::free);
  if (!here) fail("The service " + path + ": " + errorText(errno) + "; give its absolute path");
  return String(here.get()) + '/' + path;
}

}  // namespace

TrustedProgram locateService(const String& path, DescriptorRegistry& registry) {
  const String program = path.empty() ? findService() : path;
  return {.file = Walk(program, registry).to(absolute(program)), .path = program};
}

}  // namespace Keelgate
