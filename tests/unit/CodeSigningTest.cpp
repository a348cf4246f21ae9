#include "platform/signing/CodeSigning.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>

#include "platform/signing/Sha1.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using tests::ChildProcess;

constexpr const char* kRight = "com.example.right";
constexpr const char* kRights =
    R"(<plist version="1.0"><dict><key>com.example.right</key><string>yes</string></dict></plist>)";

std::string infoNaming(const std::string& executable) {
  return R"(<plist version="1.0"><dict><key>HBBundleExecutable</key><string>)" + executable +
         "</string></dict></plist>";
}

// Host.app with bin/host (a cat) and entitlements, all of it trusted.
class CodeSigningTest : public testing::Test {
 protected:
  void SetUp() override { rebuild(); }

  void rebuild() {
    fs::remove_all(app_);
    fs::create_directories(app_ + "/bin");
    fs::copy_file("/bin/cat", host_);
    write(app_ + "/Info.plist", infoNaming("bin/host"));
    write(app_ + "/Entitlements.plist", kRights);
    for (const std::string& path : {app_, app_ + "/bin", host_}) ASSERT_EQ(::chmod(path.c_str(), 0755), 0);
  }

  static void write(const std::string& path, const std::string& text) {
    std::ofstream(path) << text;
    ASSERT_EQ(::chmod(path.c_str(), 0644), 0);
  }

  // What the process answers to one question: the right's text, "nothing", or "error".
  static std::string ask(CodeSigningTask& task) {
    Error error;
    const Value value = task.copyEntitlementValue(kRight, &error);
    if (!error.domain.empty()) return value ? "both" : "error";
    return value ? value.string() : "nothing";
  }

  std::string askFresh(const std::string& executable) {
    const ChildProcess child(executable);
    if (!child.running()) return "not run";
    return ask(*signing_->taskForAuditToken(child.peer()));
  }

  static void replace(const std::string& path, const std::function<void()>& make) {
    fs::rename(path, path + ".old");
    make();
  }

  tests::TemporaryDirectory directory_;
  const std::string app_ = directory_.path("Host.app");
  const std::string host_ = app_ + "/bin/host";
  const std::shared_ptr<CodeSigning> signing_ = CodeSigning::make();
};

TEST_F(CodeSigningTest, EntitlementsCountOnlyUnderTheRuleOfTrust) {
  struct Case {
    const char* what;
    std::string path;
    std::function<void(const std::string&)> change;
    bool refused;
  };
  const auto mode = [](unsigned bits) { return [bits](const std::string& path) { ::chmod(path.c_str(), bits); }; };
  const auto owner = [](const std::string& path) { ASSERT_EQ(::lchown(path.c_str(), 12345, 0), 0); };
  const auto link = [](const std::string& path) { replace(path, [&] { fs::create_symlink(path + ".old", path); }); };
  const auto folder = [](const std::string& path) { replace(path, [&] { fs::create_directory(path); }); };
  const std::string info = app_ + "/Info.plist";
  const std::string rights = app_ + "/Entitlements.plist";
  std::vector<Case> cases = {
      {"nothing changed", app_, mode(0755), false},
      {"sticky directory", app_, mode(01777), false},
      {"group-writable directory of the executable", app_ + "/bin", mode(0775), true},
      {"world-writable directory", app_, mode(0757), true},
      {"sticky group-writable entitlements", rights, mode(01664), true},
      {"group-writable Info.plist", info, mode(0664), true},
      {"Info.plist is a link", info, link, true},
      {"entitlements are a directory", rights, folder, true},
  };
  if (::geteuid() == 0) {
    for (const std::string& path : {directory_.path(), app_, info, rights, host_}) {
      cases.push_back({"foreign owner", path, owner, true});
    }
  }
  for (const Case& test : cases) {
    SCOPED_TRACE(std::string(test.what) + " " + test.path);
    test.change(test.path);
    EXPECT_EQ(askFresh(host_), test.refused ? "error" : "yes");
    Error error;
    const Value entitlements = entitlementsOfBundle(app_, &error);
    EXPECT_EQ(entitlements[kRight].string(), test.refused ? "" : "yes");
    EXPECT_EQ(error.domain, test.refused ? "POSIX" : "") << error.describe();
    EXPECT_EQ(bundleTrustProblem(app_).has_value(), test.refused);
    ASSERT_EQ(::chmod(directory_.path().c_str(), 0755) | ::lchown(directory_.path().c_str(), ::geteuid(), ::getegid()),
              0);
    rebuild();
  }
  EXPECT_EQ(trustProblem(host_), std::nullopt);
  EXPECT_EQ(trustProblem(directory_.path() + "/"), std::nullopt);
  fs::create_symlink(host_, app_ + "/link");
  EXPECT_NE(trustProblem(app_ + "/link"), std::nullopt);
  EXPECT_EQ(trustProblem(app_ + "/missing")->code, 260);
}

TEST_F(CodeSigningTest, DamagedEntitlementsAreAnErrorAndSaidOncePerChange) {
  tests::LogCapture log;
  const std::string rights = app_ + "/Entitlements.plist";
  write(rights, "<plist");
  EXPECT_EQ(askFresh(host_), "error");
  EXPECT_EQ(askFresh(host_), "error");
  const auto lines = log.take();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_TRUE(lines[0].starts_with("ERROR -: cannot use " + rights + ": PropertyList 1: ")) << lines[0];
  write(rights, R"(<plist version="1.0"><string>all</string></plist>)");
  Error error;
  EXPECT_TRUE(entitlementsOfBundle(app_, &error).isNothing());
  EXPECT_EQ(error.description, rights + ": not a dictionary");
}

TEST_F(CodeSigningTest, ABundleAnswersForTheExecutableItNames) {
  fs::create_symlink(host_, app_ + "/bin/link");
  fs::create_symlink(app_ + "/bin", app_ + "/other");
  const std::vector<std::pair<std::string, bool>> cases = {
      {"bin/host", true},     {"./bin//host", true}, {"bin/missing", true},           {"", true},
      {"bin/link", false},    {"other/host", false}, {"../Host.app/bin/host", false}, {"bin", false},
      {"Info.plist/x", false}};
  for (const auto& [executable, counts] : cases) {
    write(app_ + "/Info.plist", infoNaming(executable));
    Error error;
    EXPECT_EQ(entitlementsOfBundle(app_, &error).isDictionary(), counts) << executable;
    EXPECT_EQ(error.domain.empty(), counts) << executable;
  }
}

TEST(Sha1Test, AnswersTheDigestOfThePublishedExample) {
  const std::string_view text = "abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq";
  std::string hex;
  for (const std::uint8_t byte : sha1({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()})) {
    hex += fmt::format("{:02x}", byte);
  }
  EXPECT_EQ(hex, "84983e441c3bd26ebaae4aa1f95129e5e54670f1");
}

}  // namespace
}  // namespace platform
