#include "Extora/XTBundle.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"

namespace extora {
namespace {

class XTBundleTest : public testing::Test {
 protected:
  void SetUp() override {
    std::string name = testing::TempDir() + "XTBundleXXXXXX";
    ASSERT_NE(mkdtemp(name.data()), nullptr);
    root_ = std::filesystem::canonical(name);
    app_ = root_ / "Mail.app";
    std::filesystem::create_directories(app_ / "bin");
    std::filesystem::create_directories(root_ / "Empty.app");
    std::ofstream(app_ / "bin/mail") << "x";
    std::ofstream(app_ / "Info.plist") << R"(<plist version="1.0"><dict><key>HBBundleIdentifier</key>)"
                                          R"(<string>com.example.mail</string><key>HBBundleExecutable</key>)"
                                          R"(<string>bin/mail</string></dict></plist>)";
  }
  void TearDown() override { std::filesystem::remove_all(root_); }

  std::filesystem::path root_;
  std::filesystem::path app_;
};

TEST_F(XTBundleTest, ABundleIsFoundByItsPathAndByItsExecutable) {
  for (const auto& bundle :
       {XTBundle::initWithURL(platform::Url::file(app_.string())), XTBundle::initWithExecutablePath(app_ / "bin/mail"),
        XTBundle::initWithExecutablePath(app_)}) {
    EXPECT_EQ(bundle->path(), app_);
    EXPECT_EQ(bundle->url(), platform::Url::file(app_.string()));
    EXPECT_EQ(bundle->executablePath(), app_ / "bin/mail");
    EXPECT_EQ(bundle->plugInsPath(), app_ / "PlugIns");
    EXPECT_EQ(bundle->bundleIdentifier(), "com.example.mail");
    EXPECT_EQ(bundle->infoDictionary()["HBBundleExecutable"], platform::Value("bin/mail"));
  }
}

TEST_F(XTBundleTest, WithoutInfoPlistBothLinesAreLogged) {
  tests::LogCapture log("info");
  const std::string empty = root_ / "Empty.app";
  const auto bundle = XTBundle::initWithPath(empty);
  EXPECT_EQ(bundle->bundleIdentifier(), std::nullopt);
  EXPECT_EQ(bundle->executablePath(), bundle->path());
  (void)log.take();
  EXPECT_TRUE(bundle->infoDictionary().isNothing());
  const std::string path = bundle->path().value_or("(null)");
  EXPECT_EQ(log.take(), (std::vector<std::string>{
                            "INFO ops: failed to retrieve Info.plist for " + path + " through " + bundle->describe(),
                            "INFO ops: failed to convert Info.plist to dictionary: " + path + " source=(null)"}));
}

}  // namespace
}  // namespace extora
