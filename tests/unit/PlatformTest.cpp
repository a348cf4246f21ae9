#include "platform/Platform.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>

#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

mode_t modeOf(const std::string& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 ? status.st_mode & 07777U : 0;
}

class PlatformTest : public testing::Test {
 protected:
  PlatformTest() {
    directories_.runtime = directory_.path("a/run");
    directories_.state = directory_.path("a/state");
    directories_.config = directory_.path("config");
    directories_.applications = {directory_.path("Applications")};
    directories_.systemPlugIns = directory_.path("PlugIns");
    directories_.extensionPoints = directory_.path("ExtensionPoints");
  }
  tests::TemporaryDirectory directory_;
  Directories directories_;
};

TEST_F(PlatformTest, DirectoriesAndCountersAreThereWhenItIsMade) {
  std::filesystem::create_directories(directories_.state);
  std::filesystem::permissions(directories_.state, std::filesystem::perms::owner_all);
  const mode_t umask = ::umask(077);
  const auto platform = Platform::make(directories_, nullptr);
  ::umask(umask);
  ASSERT_NE(platform, nullptr);
  EXPECT_EQ(modeOf(directories_.state), 0711U);
  EXPECT_EQ(modeOf(directories_.state + "/Containers"), 0711U);
  EXPECT_EQ(modeOf(directories_.state + "/lock"), 0600U);
  for (const char* name : {"", "/services", "/notify"}) EXPECT_EQ(modeOf(directories_.runtime + name), 0755U) << name;
  EXPECT_EQ(platform->notifications->counter("com.orvane.extora.annotation-change"), 0U);
  EXPECT_TRUE(platform->notifications->counter("com.orvane.registry-change").has_value());
  EXPECT_TRUE(platform->registry->registryInstalledPlugIns().empty());
}

TEST_F(PlatformTest, WhatStandsInTheWayIsSaid) {
  std::filesystem::create_directory(directory_.path("a"));
  std::ofstream(directories_.runtime) << "a file";
  Error error;
  EXPECT_EQ(Platform::make(directories_, &error), nullptr);
  EXPECT_EQ(error.code, EEXIST);
  EXPECT_NE(error.localizedDescription().find(directories_.runtime), std::string::npos);
}

}  // namespace
}  // namespace platform
