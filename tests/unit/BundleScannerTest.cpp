#include "platform/registry/BundleScanner.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>

#include "tests/support/PrintDescribed.h"
#include "tests/support/SampleBundles.h"
#include "tests/support/TestPlatform.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using tests::sampleApplication;
using tests::SampleBundle;
using tests::samplePlugIn;

class BundleScannerTest : public ::testing::Test {
 protected:
  ScannedGroup scan(const std::string& path) {
    const ScannedGroup group = BundleScanner::scanApplication(path, [&](const std::string& each) -> RegistrationPtr {
      const auto place = known_.find(each);
      return place == known_.end() ? nullptr : place->second;
    });
    if (group.application != nullptr) known_[group.application->path] = group.application;
    for (const RegistrationPtr& plugIn : group.plugIns) known_[plugIn->path] = plugIn;
    return group;
  }
  /// "<name of the place>: <reason>" of each problem.
  static std::vector<std::string> reasons(const ScannedGroup& group) {
    std::vector<std::string> all;
    for (const ScanProblem& each : group.problems) {
      all.push_back(fs::path(each.path).filename().native() + ": " + each.reason);
    }
    return all;
  }
  void write(const std::string& path, const std::string& content) { std::ofstream(path) << content; }

  tests::TemporaryDirectory directory_;
  std::map<std::string, RegistrationPtr> known_;
};

using Reasons = std::vector<std::string>;

TEST_F(BundleScannerTest, NamesFallBackFromLanguageToLanguageToThePlainOnesToTheDirectory) {
  BundleRegistration bundle;
  bundle.path = "/x/Some.thing.appex";
  bundle.info = Dictionary{};
  EXPECT_EQ(bundle.localizedName({}), "Some.thing");
  bundle.info = Dictionary{{"HBBundleName", "Plain"}};
  EXPECT_EQ(bundle.localizedName({}), "Plain");
  bundle.names = {{"de", "", "Kurz"}, {"de_CH", "Schweiz", ""}};
  EXPECT_EQ(bundle.localizedShortName({"de_CH", "de"}), "Kurz");
  EXPECT_EQ(bundle.localizedName({"de_CH", "de"}), "Schweiz");
  EXPECT_EQ(bundle.localizedName({"de"}), "Kurz");
  bundle.info = Dictionary{{"HBBundleName", "Plain"}, {"HBBundleDisplayName", "Plain display"}};
  EXPECT_EQ(bundle.localizedName({"de"}), "Plain display")
      << "a display name, in whatever language, before a short name";
}

TEST_F(BundleScannerTest, IdentifierAndDictionaryOfAPlugInComeFromWhereTheRulesSay) {
  BundleRegistration bundle;
  bundle.info =
      Dictionary{{"HBBundleIdentifier", "bundle"},
                 {"HXExtension", Dictionary{{"HXExtensionAttributes", Dictionary{{"HXExtensionIdentifier", "own"}}}}}};
  EXPECT_EQ(bundle.identifier(), "own");
  bundle.info = Dictionary{{"HBBundleIdentifier", "bundle"}, {"HXExtension", Array()}, {"Extora", Dictionary{}}};
  EXPECT_TRUE(bundle.isPlugIn());
  EXPECT_TRUE(bundle.plugInDictionary().isNothing());
  EXPECT_EQ(bundle.identifier(), "bundle");
  bundle.info = Dictionary{{"HXExtension", Dictionary{{"HXExtensionProtocol", "#Data"}}}};
  EXPECT_TRUE(bundle.isDataOnly());
  EXPECT_EQ(bundle.identifier(), "");
}

TEST_F(BundleScannerTest, WhatCannotBeReadIsLeftOutWithItsReasonAndTheRestStays) {
  const std::string path = tests::writeBundle(
      directory_.path(),
      sampleApplication("com.example.mail", {samplePlugIn("good"), samplePlugIn("broken"), samplePlugIn("list"),
                                             samplePlugIn("pipe"), samplePlugIn("link"), samplePlugIn("empty")}));
  const std::string plugIns = path + "/PlugIns/";
  write(plugIns + "broken.appex/Info.plist", "<plist version=\"1.0\">\n<dict>");
  tests::writePropertyList(plugIns + "list.appex/Info.plist", Array{Value(1)});
  fs::remove(plugIns + "pipe.appex/Info.plist");
  ASSERT_EQ(mkfifo((plugIns + "pipe.appex/Info.plist").c_str(), 0644), 0);
  fs::rename(plugIns + "link.appex/Info.plist", directory_.path("elsewhere"));
  fs::create_symlink(directory_.path("elsewhere"), plugIns + "link.appex/Info.plist");
  fs::remove(plugIns + "empty.appex/Info.plist");
  fs::create_directory_symlink(plugIns + "good.appex", plugIns + "second.appex");
  fs::create_directory(plugIns + "\xff.appex");

  const ScannedGroup group = scan(path);
  ASSERT_EQ(group.plugIns.size(), 1U);
  EXPECT_EQ(group.plugIns[0]->identifier(), "good");
  const Reasons expected{"broken.appex: Info.plist: line 2, column 6: no element found",
                         "empty.appex: no Info.plist",
                         "link.appex: Info.plist is a link",
                         "list.appex: Info.plist is not a dictionary",
                         "pipe.appex: Info.plist is not a regular file",
                         "second.appex: it is a link",
                         "\xef\xbf\xbd.appex: its name is not UTF-8 text"};
  Reasons found = reasons(group);
  ASSERT_EQ(found.size(), expected.size()) << testing::PrintToString(found);
  EXPECT_TRUE(found[0].starts_with("broken.appex: Info.plist: line 2")) << found[0];
  found[0] = expected[0];
  EXPECT_EQ(found, expected);

  fs::remove(path + "/Info.plist");
  EXPECT_EQ(reasons(scan(path)), Reasons{"mail.app: no Info.plist"});
  EXPECT_FALSE(scan(directory_.path("missing.app")).found);
  EXPECT_TRUE(scan(directory_.path("missing.app")).problems.empty());
  std::vector<ScanProblem> problems;
  fs::create_directory_symlink(path, directory_.path("linked.app"));
  EXPECT_EQ(BundleScanner::rootsIn(directory_.path(), BundleScanner::FolderKind::Applications, problems),
            std::vector<std::string>{path});
  EXPECT_EQ(problems.size(), 1U);
}

TEST_F(BundleScannerTest, ARegistrationIsUsedAgainUntilOneOfItsFilesChanges) {
  SampleBundle filter = samplePlugIn("filter");
  filter.entitlements = Dictionary{{"right", 1}};
  filter.tables["de/InfoPlist"] = {{"HBBundleName", "alt"}};
  const std::string path = tests::writeBundle(directory_.path(), sampleApplication("mail", {filter}));
  const std::string plugIn = path + "/PlugIns/filter.appex";
  RegistrationPtr last = scan(path).plugIns.at(0);
  const RegistrationPtr application = known_.at(path);
  EXPECT_EQ(scan(path).plugIns.at(0), last);

  const auto expectAnother = [&](const char* what) {
    const RegistrationPtr now = scan(path).plugIns.at(0);
    EXPECT_NE(now, last) << what;
    EXPECT_NE(now->uuid, last->uuid) << what;
    EXPECT_EQ(scan(path).plugIns.at(0), now) << what;
    last = now;
  };
  // Same size, same inode: only the modification time tells.
  fs::last_write_time(plugIn + "/Info.plist", fs::last_write_time(plugIn + "/Info.plist") + std::chrono::seconds(1));
  expectAnother("Info.plist");
  tests::writePropertyList(plugIn + "/Entitlements.plist", Dictionary{{"right", 22}});
  expectAnother("Entitlements.plist");
  EXPECT_EQ(last->entitlements["right"], Value(22));
  fs::remove(plugIn + "/Entitlements.plist");
  expectAnother("no Entitlements.plist");
  tests::writePropertyList(plugIn + "/Localization/de/InfoPlist.plist", Dictionary{{"HBBundleName", "neuer"}});
  expectAnother("a table");
  EXPECT_EQ(last->localizedName({"de"}), "neuer");
  fs::create_directory(plugIn + "/Localization/it");
  expectAnother("a language");
  tests::writePropertyList(plugIn + "/Localization/it/InfoPlist.plist", Dictionary{{"HBBundleName", "nuovo"}});
  expectAnother("a table of a language that had none");
  fs::remove_all(plugIn + "/Localization");
  expectAnother("no localization");
  EXPECT_EQ(known_.at(path), application) << "the application itself is as it was";
}

TEST_F(BundleScannerTest, EntitlementsThatDoNotCountAreNothingUntilTheyDo) {
  SampleBundle filter = samplePlugIn("filter");
  filter.entitlements = Dictionary{{"right", true}};
  const std::string path = tests::writeBundle(directory_.path(), sampleApplication("mail", {filter}));
  const std::string file = path + "/PlugIns/filter.appex/Entitlements.plist";
  fs::permissions(file, fs::perms::group_write, fs::perm_options::add);
  const ScannedGroup refused = scan(path);
  ASSERT_EQ(refused.plugIns.size(), 1U);
  EXPECT_TRUE(refused.plugIns[0]->entitlements.isNothing());
  ASSERT_EQ(refused.problems.size(), 1U);
  EXPECT_EQ(refused.problems[0].kind, ScanProblem::Kind::Entitlements);
  EXPECT_EQ(scan(path).plugIns[0], refused.plugIns[0]);

  // The file itself stays as it was, so that only asking again finds out.
  fs::permissions(file, fs::perms::group_write, fs::perm_options::remove);
  const ScannedGroup accepted = scan(path);
  EXPECT_EQ(accepted.plugIns.at(0)->entitlements, filter.entitlements);
  EXPECT_NE(accepted.plugIns[0]->uuid, refused.plugIns[0]->uuid);
}

}  // namespace
}  // namespace platform
