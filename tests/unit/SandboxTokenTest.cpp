#include <dirent.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <filesystem>
#include <fstream>

#include "platform/hostservices/GrantedPlace.h"
#include "platform/sandbox/Sandbox.h"
#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

namespace fs = std::filesystem;

void write(const std::string& path, const std::string& content) {
  std::ofstream(path) << content;
}

std::string readAll(int fd) {
  std::array<char, 64> buffer{};
  const ssize_t size = ::read(fd, buffer.data(), buffer.size());
  return size < 0 ? "error" : std::string(buffer.data(), static_cast<std::size_t>(size));
}

class SandboxTokenTest : public testing::Test {
 protected:
  SandboxTokenTest() {
    fs::permissions(directory_.path(), fs::perms::all & ~fs::perms::others_write & ~fs::perms::group_write);
    fs::create_directories(bundle_ + "/images");
    fs::create_directory(bundle_ + "Other");
    write(bundle_ + "/images/cat", "miaow");
    write(bundle_ + "Other/secret", "secret");
    write(directory_.path("outside"), "outside");
  }

  std::optional<std::string> issue(const std::string& path) {
    error_ = 0;
    return sandbox_->issueFileReadExtension(path, bundle_, &error_);
  }
  UniqueFd open(const std::string& token) {
    error_ = 0;
    const auto grant = sandbox_->verifyExtension(token, &error_);
    return grant ? openGrantedPlace(*grant, &error_) : UniqueFd();
  }
  bool refused(const std::string& token) {
    error_ = 0;
    return !sandbox_->verifyExtension(token, &error_) && error_ == EACCES;
  }

  // Everything that a directory's clone must give and must not give.
  void expectReadOnlyView(int tree) {
    const UniqueFd file(::openat(tree, "images/cat", O_RDONLY));
    EXPECT_EQ(readAll(file.get()), "miaow");
    DIR* const listing = ::fdopendir(::dup(tree));
    EXPECT_TRUE(listing != nullptr && ::closedir(listing) == 0) << "it can be listed";
    EXPECT_LT(::openat(tree, "images/cat", O_RDWR), 0);
    EXPECT_EQ(errno, EROFS);
    EXPECT_LT(::openat(tree, "images/new", O_WRONLY | O_CREAT, 0600), 0);
    EXPECT_EQ(errno, EROFS);
    EXPECT_LT(::openat(tree, "../outside", O_RDONLY), 0);
    EXPECT_EQ(errno, ENOENT) << "there is nothing above it";
    EXPECT_LT(::openat(tree, "images/link", O_RDONLY), 0);
    EXPECT_EQ(errno, ELOOP) << "links are not followed";
  }

  tests::TemporaryDirectory directory_;
  const std::string bundle_ = directory_.path("Filter.appex");
  std::shared_ptr<Sandbox> sandbox_ = Sandbox::make();
  int error_ = 0;
};

TEST_F(SandboxTokenTest, NothingButTheVeryTokenIsTaken) {
  const auto token = issue(bundle_ + "/images");
  ASSERT_TRUE(token);
  const auto grant = sandbox_->verifyExtension(*token, &error_);
  ASSERT_TRUE(grant);
  EXPECT_EQ(grant->subject, fs::canonical(bundle_ + "/images"));
  EXPECT_EQ(grant->extensionClass, kFileReadExtensionClass);

  for (std::size_t at = 0; at < token->size(); ++at) {
    std::string changed = *token;
    changed[at] = static_cast<char>(changed[at] ^ 1);
    EXPECT_TRUE(refused(changed)) << "byte " << at;
    EXPECT_TRUE(refused(token->substr(0, at))) << "cut at " << at;
  }
  EXPECT_TRUE(refused(*token + "/cat"));
  EXPECT_TRUE(refused(" " + *token));
  EXPECT_TRUE(refused(std::string(64, '0') + token->substr(64))) << "forged";
  // The same claims in the other class.
  std::string other = *token;
  other.replace(other.find(kFileReadExtensionClass), std::string(kFileReadExtensionClass).size(),
                kPlugInServiceExtensionClass);
  EXPECT_TRUE(refused(other));

  sandbox_ = Sandbox::make();
  EXPECT_TRUE(refused(*token)) << "of another key, as after a restart";
}

TEST_F(SandboxTokenTest, ServiceTokensCarryAnyNameAndEachTokenIsFresh) {
  const std::string name = "com.example;f;0;\xC3\xA9";
  const auto first = sandbox_->issueServiceExtension(kPlugInServiceExtensionClass, name, &error_);
  const auto second = sandbox_->issueServiceExtension(kPlugInServiceExtensionClass, name, &error_);
  ASSERT_TRUE(first && second);
  EXPECT_NE(*first, *second);
  EXPECT_EQ(sandbox_->verifyExtension(*first, &error_)->subject, name);
  EXPECT_EQ(shownToken(*first), first->substr(0, 8));
  EXPECT_FALSE(sandbox_->issueServiceExtension(kPlugInServiceExtensionClass, "", &error_));
  EXPECT_EQ(error_, EINVAL);
  EXPECT_FALSE(sandbox_->issueServiceExtension("a;b", name, &error_));
}

TEST_F(SandboxTokenTest, NothingOutsideOfTheBundleIsGranted) {
  fs::create_directory_symlink(directory_.path(), bundle_ + "/up");
  fs::create_symlink(bundle_ + "/images/cat", bundle_ + "/images/link");
  fs::create_symlink(bundle_, directory_.path("alias"));
  const auto refusal = [&](const std::string& path) { return issue(path) ? 0 : error_; };
  EXPECT_EQ(refusal(bundle_ + "/.."), EPERM);
  EXPECT_EQ(refusal(bundle_ + "/images/../../outside"), EPERM);
  EXPECT_EQ(refusal(bundle_ + "/up/outside"), EPERM);
  EXPECT_EQ(refusal(bundle_ + "/up"), EPERM);
  EXPECT_EQ(refusal(bundle_ + "Other/secret"), EPERM) << "a name that begins alike";
  EXPECT_EQ(refusal("/"), EPERM);
  EXPECT_EQ(refusal(bundle_ + "/missing"), ENOENT);
  EXPECT_EQ(refusal(bundle_ + std::string("/images\0/..", 11)), EINVAL);
  ASSERT_EQ(::mkfifo((bundle_ + "/fifo").c_str(), 0600), 0);
  EXPECT_EQ(refusal(bundle_ + "/fifo"), EINVAL);

  // Roundabout ways that stay inside are as good as straight ones.
  for (const char* way : {"", "/", "/images/../images/cat", "/images/link", "/up/Filter.appex/images"}) {
    EXPECT_EQ(refusal(bundle_ + way), 0) << way;
  }
  EXPECT_EQ(refusal(directory_.path("alias/images")), 0);
  EXPECT_TRUE(sandbox_->issueFileReadExtension(bundle_ + "/images", directory_.path("alias"), &error_));
}

// A daemon without rights over its mount namespace, as a user's own is.
TEST_F(SandboxTokenTest, AnUnprivilegedDaemonGrantsTheSame) {
  fs::create_symlink("cat", bundle_ + "/images/link");
  const auto token = issue(bundle_);
  const auto file = issue(bundle_ + "/images/cat");
  constexpr uid_t kSomebody = 65534;
  const bool root = ::geteuid() == 0;
  // His own, so that only the clone keeps him from writing.
  for (const char* name : {"", "/images", "/images/cat"}) {
    ASSERT_TRUE(!root || ::chown((bundle_ + name).c_str(), kSomebody, kSomebody) == 0);
  }
  const pid_t child = ::fork();
  if (child == 0) {
    if (root && (::setgid(kSomebody) != 0 || ::setuid(kSomebody) != 0)) ::_exit(2);
    const UniqueFd tree = open(*token);
    if (tree) expectReadOnlyView(tree.get());
    EXPECT_TRUE(tree) << error_;
    EXPECT_EQ(readAll(open(*file).get()), "miaow") << error_;
    ::_exit(testing::Test::HasFailure() ? 1 : 0);
  }
  int status = -1;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
}

TEST_F(SandboxTokenTest, ReplacedPlaceIsStale) {
  const std::string place = bundle_ + "/images";
  const auto token = issue(place);
  const auto file = issue(place + "/cat");
  fs::rename(place, directory_.path("away"));
  EXPECT_FALSE(open(*token));
  EXPECT_EQ(error_, ESTALE) << "gone";
  fs::create_directory(place);
  write(place + "/cat", "other");
  EXPECT_FALSE(open(*token));
  EXPECT_EQ(error_, ESTALE) << "another directory";
  EXPECT_FALSE(open(*file));
  EXPECT_EQ(error_, ESTALE) << "another file";
  fs::remove_all(place);
  fs::create_directory_symlink(directory_.path("away"), place);
  EXPECT_FALSE(open(*token));
  EXPECT_EQ(error_, ESTALE) << "a link to the old one";
  fs::remove(place);
  fs::rename(directory_.path("away"), place);
  EXPECT_TRUE(open(*token)) << "the very one is back";
}

}  // namespace
}  // namespace platform
