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

// Fails its n-th step with EIO, and takes 3 bytes a write.
class FaultyFiles : public PosixFiles {
 public:
  explicit FaultyFiles(int failing) : failing_(failing) {}
  std::string failed;

 protected:
  int openDirectory(const char* path) override { return fails("openDirectory") ? -1 : PosixFiles::openDirectory(path); }
  int openTemporary(int directory, const char* name) override {
    return fails("openTemporary") ? -1 : PosixFiles::openTemporary(directory, name);
  }
  ssize_t writeSome(int fd, const std::uint8_t* bytes, std::size_t size) override {
    return fails("writeSome") ? -1 : PosixFiles::writeSome(fd, bytes, std::min<std::size_t>(size, 3));
  }
  int syncFile(int fd) override { return fails("syncFile") ? -1 : PosixFiles::syncFile(fd); }
  int renameFile(int directory, const char* from, const char* to) override {
    return fails("renameFile") ? -1 : PosixFiles::renameFile(directory, from, to);
  }
  int syncDirectory(int directory) override {
    return fails("syncDirectory") ? -1 : PosixFiles::syncDirectory(directory);
  }

 private:
  bool fails(const char* step) {
    if (--failing_ != 0) return false;
    failed = step;
    errno = EIO;
    return true;
  }
  int failing_;
};

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

TEST_F(FilesTest, AFailureOfAnyStepLeavesTheOldContentAndNoTemporaryFile) {
  std::vector<std::string> failed;
  for (int n = 1; n < 100; ++n) {
    ASSERT_EQ(files_->writeFileAtomic(path_, bytesOf("old")), std::nullopt);
    FaultyFiles faulty(n);
    const auto error = faulty.writeFileAtomic(path_, bytesOf("new content"));
    EXPECT_EQ(fs::directory_iterator(directory_.path())->path(), path_);
    EXPECT_EQ(std::distance(fs::directory_iterator(directory_.path()), {}), 1) << faulty.failed;
    // After the rename there is no way back; the caller learns that it may not last.
    EXPECT_EQ(content(path_), !error || faulty.failed == "syncDirectory" ? "new content" : "old") << faulty.failed;
    if (!error) break;
    EXPECT_EQ(error->domain, "POSIX");
    EXPECT_EQ(error->code, EIO);
    EXPECT_NE(error->localizedDescription().find(directory_.path()), std::string::npos) << *error->description;
    failed.push_back(faulty.failed);
  }
  EXPECT_EQ(failed, (std::vector<std::string>{"openDirectory", "openTemporary", "writeSome", "writeSome", "writeSome",
                                              "writeSome", "syncFile", "renameFile", "syncDirectory"}));
}

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

TEST_F(FilesTest, DirectoriesHaveTheirModeWhateverTheUmask) {
  const mode_t before = ::umask(077);
  EXPECT_EQ(files_->createDirectory(directory_.path("a/b/c"), true, 0755), std::nullopt);
  EXPECT_EQ(files_->createDirectory(directory_.path("a/b/c"), false, 0700), std::nullopt) << "exists";
  ::umask(before);
  EXPECT_EQ(modeOf(directory_.path("a")), 0755U);
  EXPECT_EQ(modeOf(directory_.path("a/b/c")), 0755U);
  EXPECT_EQ(files_->createDirectory(directory_.path("x/y"), false, 0700)->code, ENOENT);
  std::ofstream(path_) << "x";
  EXPECT_EQ(files_->createDirectory(path_, true, 0700)->code, EEXIST);
  EXPECT_EQ(files_->createDirectory(path_ + "/y", true, 0700)->code, ENOTDIR);
}

TEST_F(FilesTest, ASecondNameNeverReplacesAFile) {
  std::ofstream(path_) << "damaged";
  const std::string second = directory_.path("second");
  EXPECT_EQ(files_->linkFile(path_, second), std::nullopt);
  ASSERT_EQ(files_->writeFileAtomic(path_, bytesOf("new")), std::nullopt);
  EXPECT_EQ(files_->linkFile(path_, second), std::nullopt);
  EXPECT_EQ(content(second), "damaged");
  EXPECT_EQ(files_->linkFile(directory_.path("missing"), directory_.path("third"))->code, ENOENT);
  EXPECT_EQ(files_->resolvePath(directory_.path("missing")), std::nullopt);
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
