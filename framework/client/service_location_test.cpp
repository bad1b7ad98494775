// SPDX-License-Identifier: Apache-2.0
// C15: a program that somebody else than root or the caller can replace is never executed.
#include "framework/client/service_location.h"
#include "framework/client/launch.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

namespace Keelgate {
namespace {

namespace fs = std::filesystem;

constexpr uid_t stranger = 12'345;

/// /tmp/…/{outer/inner/service, link -> outer}, all of it the caller's alone.
class ServiceLocation : public testing::Test {
 protected:
  ServiceLocation() {
    fs::create_directories(root_ / "outer/inner");
    write("outer/inner/service", "the right one");
    fs::create_symlink("outer", root_ / "link");
    for (const char* made : {"", "outer", "outer/inner", "outer/inner/service"}) {
      chmod((root_ / made).c_str(), 0755);
    }
  }
  ~ServiceLocation() override { fs::remove_all(root_); }

  void write(const char* name, const char* text) const { std::ofstream(root_ / name) << text; }

  /// "found", or the sentence.
  String outcome(const char* name = "outer/inner/service") {
    try {
      return locateService(root_ / name, registry_).file ? "found" : "nothing";
    } catch (const StartFailure& failure) {
      return failure.description;
    }
  }

  DescriptorRegistry registry_{16};
  fs::path root_ = fs::temp_directory_path() / ("keelgate-located-" + std::to_string(getpid()));
};

TEST_F(ServiceLocation, FollowsLinksDotsAndRelativePaths) {
  fs::create_symlink("../outer/./inner", root_ / "outer/again");
  fs::create_symlink(root_ / "outer/inner", root_ / "whole");
  // As many links as the kernel follows, and one more.
  for (int i = 0; i <= 40; ++i) {
    const fs::path next = i == 0 ? "outer" : std::to_string(i - 1);
    fs::create_symlink(next, root_ / std::to_string(i));
  }
  fs::create_symlink(".", root_ / "same");
  for (const char* path :
       {"outer/inner/service", "link/inner/service", "outer/again/service",
        "whole/../inner//./service", "same/outer/inner/service", "39/inner/service"}) {
    EXPECT_EQ(outcome(path), "found") << path;
  }
  EXPECT_NE(outcome("40/inner/service").find("Too many levels of symbolic links"), String::npos);
  EXPECT_NE(outcome("outer/inner/service/more").find("Not a directory"), String::npos);
  const fs::path here = fs::current_path();
  fs::current_path(root_ / "outer");
  EXPECT_TRUE(locateService("inner/service", registry_).file);
  EXPECT_TRUE(locateService("../link/inner/service", registry_).file);
  fs::current_path(here);
  EXPECT_TRUE(locateService("", registry_).file) << "that of the tree that the test was built in";
}

TEST_F(ServiceLocation, RefusesWhatOthersCanReplaceAndSaysWhere) {
  const uid_t self = geteuid();
  const std::tuple<const char*, mode_t, uid_t, const char*> rows[] = {
      {"outer/inner/service", 0775, self, "/inner/service may be written"},
      {"outer/inner/service", 0757, self, "/inner/service may be written"},
      {"outer/inner", 0777, self, "/inner may be written by others"},
      {"outer", 0775, self, "outer may be written by others"},
      {"outer", 01777, self, "found"},
      {"outer/inner/service", 0755, stranger, "belongs to user 12345"},
      {"outer/inner", 0755, stranger, "/inner belongs to user 12345"},
      {"outer", 0755, stranger, "outer belongs to user 12345"},
      {"outer", 01777, stranger, "outer belongs to user 12345"},
  };
  for (const auto& [place, mode, owner, sentence] : rows) {
    if (owner != self && self != 0) continue;
    const fs::path path = root_ / place;
    ASSERT_EQ(chown(path.c_str(), owner, static_cast<gid_t>(-1)), 0);
    ASSERT_EQ(chmod(path.c_str(), mode), 0);
    for (const char* way : {"outer/inner/service", "link/inner/service"}) {
      EXPECT_NE(outcome(way).find(sentence), String::npos) << place << mode << outcome(way);
    }
    ASSERT_EQ(chown(path.c_str(), self, static_cast<gid_t>(-1)), 0);
    ASSERT_EQ(chmod(path.c_str(), 0755), 0);
  }
}

TEST_F(ServiceLocation, RefusesALinkThatAStrangerMade) {
  if (geteuid() != 0) GTEST_SKIP() << "only root can give a link away";
  ASSERT_EQ(lchown((root_ / "link").c_str(), stranger, stranger), 0);
  EXPECT_NE(outcome("link/inner/service").find("link belongs to user 12345"), String::npos);
}

TEST_F(ServiceLocation, KeepsTheFileThatWasLookedAt) {
  const fs::path service = root_ / "outer/inner/service";
  struct stat before {};
  ASSERT_EQ(stat(service.c_str(), &before), 0);
  const TrustedProgram program = locateService(service, registry_);
  write("another", "another one");
  fs::rename(root_ / "another", service);
  struct stat held {};
  ASSERT_EQ(fstat(program.file.get(), &held), 0);
  EXPECT_EQ(held.st_ino, before.st_ino);
}

}  // namespace
}  // namespace Keelgate
