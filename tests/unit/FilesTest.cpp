#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <fstream>

#include "platform/files/PosixFiles.h"
#include "platform/files/ProcessPaths.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

namespace fs = std::filesystem;

Bytes bytesOf(std::string_view text) {
  return {text.begin(), text.end()};
}

mode_t modeOf(const std::string& path) {
  struct stat status {};
  return ::lstat(path.c_str(), &status) == 0 ? status.st_mode & 07777U : 0;
}

class FilesTest : public testing::Test {
 protected:
  std::string content(const std::string& path) {
    const auto bytes = files_->readFileData(path, nullptr);
    return bytes ? std::string(bytes->begin(), bytes->end()) : "(none)";
  }

  tests::TemporaryDirectory directory_;
  const std::string path_ = directory_.path("file");
  const std::shared_ptr<Files> files_ = Files::make();
};

TEST_F(FilesTest, AWriteFollowsNoLinkAndReplacesWhatADeadProcessLeft) {
  const std::string other = directory_.path("other");
  std::ofstream(other) << "other";
  for (const bool link : {false, true}) {
    if (link) fs::create_symlink(other, path_ + ".tmp");
    if (!link) std::ofstream(path_ + ".tmp") << "half";
    fs::remove(path_);
    fs::create_symlink(other, path_);
    ASSERT_EQ(files_->writeFileAtomic(path_, bytesOf("new")), std::nullopt);
    EXPECT_EQ(content(path_), "new");
    EXPECT_EQ(content(other), "other");
    EXPECT_FALSE(fs::is_symlink(path_));
    EXPECT_EQ(modeOf(path_), 0600U);
    EXPECT_FALSE(fs::exists(fs::symlink_status(path_ + ".tmp")));
  }
  EXPECT_EQ(files_->writeFileAtomic(directory_.path("missing/file"), {})->code, ENOENT);
}

TEST_F(FilesTest, WhatCannotBeReadSaysWhy) {
  ASSERT_EQ(::mkfifo(directory_.path("pipe").c_str(), 0600), 0);
  std::ofstream(path_) << "x";
  const std::vector<std::pair<std::string, std::int64_t>> cases = {
      {"missing", kFileDoesNotExist}, {"", EISDIR}, {"pipe", EINVAL}, {"file/below", ENOTDIR}};
  for (const auto& [name, code] : cases) {
    Error error;
    EXPECT_EQ(files_->readFileData(directory_.path(name), &error), std::nullopt);
    EXPECT_EQ(error.domain, "POSIX");
    EXPECT_EQ(error.code, code) << name;
    EXPECT_NE(error.localizedDescription().find(directory_.path(name)), std::string::npos);
  }
  EXPECT_EQ(content("/proc/self/comm").back(), '\n') << "a file that says it is empty";
}

TEST_F(FilesTest, PathsOfProcessesFitTheirBuffers) {
  // Names of 255 bytes, the last so long that the path has the given length.
  for (const std::size_t length : {1023U, 1024U}) {
    std::string place = directory_.path();
    while (length - place.size() > 257)
      place += "/" + std::string(std::min<std::size_t>(200, length - place.size() - 3), 'd');
    fs::create_directories(place);
    const std::string path = place + "/" + std::string(length - place.size() - 1, 'x');
    fs::copy_file("/bin/cat", path);

    tests::ChildProcess child(path);
    ASSERT_TRUE(child.running());
    EXPECT_EQ(executablePathOfPid(*child.peer()), path);
    int number = 0;
    EXPECT_EQ(processExecutablePath(*child.peer(), &number), length < 1024 ? std::optional(path) : std::nullopt);
    EXPECT_EQ(number, length < 1024 ? 0 : ENAMETOOLONG);
    child.end();
    EXPECT_EQ(processExecutablePath(*child.peer(), &number), std::nullopt);
    EXPECT_EQ(number, ESRCH);
  }
}

}  // namespace
}  // namespace platform
