#include "platform/consent/ConsentService.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"
#include "xtd/XTDatabase.h"

namespace extora {
namespace {

using Lines = std::vector<std::string>;
using Services = std::set<std::string>;

class ConsentServiceTest : public ::testing::Test {
 protected:
  ConsentServiceTest() {
    platform_.services->directories.state = platform_.directory.path();
    platform_.services->consent = platform::ConsentService::make(platform_.services->directories);
    database_ = XTDatabase::initWithDatabase(platform_.services, platform_.directory.path("db"));
    database_->setCacheLimit(10);
    std::filesystem::create_directory(application_);
    write(application_ + "/Info.plist", "<dict><key>HBBundleIdentifier</key><string>com.a.app</string></dict>");
    platform::ARApplicationProxy application;
    application.bundleURL = Url::file(application_);
    plugIn_ = database_->plugInForProxy(
        platform::plugInRecord(platform_.registry->install(application, {tests::sampleRecord("com.a")}), 0));
  }
  static void write(const std::string& path, const std::string& body) {
    std::ofstream(path, std::fstream::trunc) << "<plist version=\"1.0\">" << body << "</plist>";
  }
  void consents(const std::string& body) { write(platform_.directory.path("consent.plist"), body); }

  tests::TestPlatform platform_;
  std::string application_ = platform_.directory.path("A.app");
  std::shared_ptr<XTDatabase> database_;
  std::shared_ptr<XTDPlugIn> plugIn_;
};

TEST_F(ConsentServiceTest, GrantsAreReadFreshForTheContainingApplication) {
  consents(
      "<dict><key>com.a.app</key><dict><key>one</key><true/><key>two</key><false/><key>three</key><integer>1"
      "</integer><key>four</key><true/></dict><key>com.a</key><dict><key>plug-in</key><true/></dict></dict>");
  EXPECT_EQ(plugIn_->allowedConsentServices(), Services({"four", "one"}));
  consents("<dict><key>com.a.app</key><dict><key>two</key><true/></dict></dict>");
  EXPECT_EQ(plugIn_->allowedConsentServices(), Services({"two"}));
  tests::LogCapture log("info");
  consents("<dict/>");
  EXPECT_EQ(plugIn_->allowedConsentServices(), Services());
  platform::ARExtoraProxy outside = tests::sampleRecord("com.outside");
  outside.bundleURL = Url::file("/System/com.outside.appex");
  const auto group = platform_.registry->install(std::nullopt, {outside});
  EXPECT_EQ(database_->plugInForProxy(platform::plugInRecord(group, 0))->allowedConsentServices(), Services());
  EXPECT_EQ(log.take(), Lines({"DEFAULT ops: createPlugInForProxy"})) << "no records are an answer";
}

TEST_F(ConsentServiceTest, WhatCannotAnswerGrantsNothing) {
  const std::string failed = "INFO ops: ConsentAccessCopyInformationForBundle failed for ";
  const auto linesOfAQuestion = [&] {
    tests::LogCapture log("info");
    EXPECT_EQ(plugIn_->allowedConsentServices(), Services());
    return log.take();
  };
  Lines lines = linesOfAQuestion();
  ASSERT_EQ(lines.size(), 1U) << "no file is no damage";
  EXPECT_EQ(lines[0].substr(0, failed.size()), failed);
  consents("<array/>");
  EXPECT_EQ(linesOfAQuestion().size(), 2U);
  EXPECT_EQ(linesOfAQuestion().size(), 1U) << "damage is reported once per change";
  std::filesystem::remove_all(application_);
  EXPECT_EQ(linesOfAQuestion(), Lines({"INFO ops: failed to create bundle for /Apps/com.a.app/PlugIns/com.a.appex"}));
}

}  // namespace
}  // namespace extora
