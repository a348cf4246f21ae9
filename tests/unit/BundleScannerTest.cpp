#include "platform/registry/BundleScanner.h"

#include <gtest/gtest.h>

#include <filesystem>

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

  tests::TemporaryDirectory directory_;
  std::map<std::string, RegistrationPtr> known_;
};

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

}  // namespace
}  // namespace platform
