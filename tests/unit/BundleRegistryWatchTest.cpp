#include <fcntl.h>
#include <gtest/gtest.h>
#include <stdio.h>

#include "platform/registry/BundleRegistry.h"
#include "tests/support/RegistryFixture.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using tests::installBundle;
using tests::removeBundle;
using tests::sampleApplication;
using tests::SampleBundle;
using tests::samplePlugIn;
using tests::writeBundle;

class BundleRegistryWatchTest : public tests::RegistryFixture {
 protected:
  BundleRegistryWatchTest() { options_.watch = true; }
  bool waitForNames(const Names& wanted) {
    const bool found = waitFor([&] { return names() == wanted; });
    if (!found) ADD_FAILURE() << testing::PrintToString(names()) << testing::PrintToString(log_.take());
    return found;
  }
  std::size_t linesWith(const std::string& text) {
    for (std::string& line : log_.take()) lines_.push_back(std::move(line));
    return static_cast<std::size_t>(std::count_if(
        lines_.begin(), lines_.end(), [&](const auto& line) { return line.find(text) != std::string::npos; }));
  }
  std::vector<std::string> lines_;
};

TEST_F(BundleRegistryWatchTest, AnExchangeInOneStepIsAReplacementAlsoWhenTheFilesAreTheSame) {
  const SampleBundle mail = sampleApplication("mail", {samplePlugIn("filter")});
  const std::string path = writeBundle(apps_, mail);
  start();
  const auto first = named("filter")->plugInUUID;
  // The new bundle shares its files with the old one, so that no stamp tells them apart.
  const std::string twin = directory_.path("mail.app");
  fs::copy(path, twin, fs::copy_options::recursive | fs::copy_options::create_hard_links);
  ASSERT_EQ(::renameat2(AT_FDCWD, twin.c_str(), AT_FDCWD, path.c_str(), RENAME_EXCHANGE), 0);
  const auto isAnother = [&](const std::optional<Uuid>& than) {
    const PlugInRecord now = named("filter");
    return now != nullptr && now->plugInUUID != than;
  };
  ASSERT_TRUE(waitFor([&] { return isAnother(first); }));
  EXPECT_EQ(observer_->take(), (Names{"-filter", "+filter"}));

  // Away and back before anybody looks: a new registration all the same.
  const auto second = named("filter")->plugInUUID;
  fs::rename(path, path + ".away");
  fs::rename(path + ".away", path);
  ASSERT_TRUE(waitFor([&] { return isAnother(second); }));
  EXPECT_EQ(observer_->take(), (Names{"-filter", "+filter"}));
}

TEST_F(BundleRegistryWatchTest, ABundleThatIsCopiedInPlaceIsCompleteInTheEnd) {
  start();
  SampleBundle filter = samplePlugIn("filter");
  filter.entitlements = Dictionary{{"right", true}};
  filter.tables["de/InfoPlist"] = {{"HBBundleName", "Deutsch"}};
  locale_->lang = "de";
  const std::string source = writeBundle(directory_.path(), sampleApplication("mail", {samplePlugIn("a"), filter}));
  const std::string path = apps_ + "/mail.app";
  // In steps, each of which is seen before the next.
  fs::create_directory(path);
  ASSERT_TRUE(waitFor([&] { return linesWith("left out " + path + ": no Info.plist") == 1; }));
  fs::copy_file(source + "/Info.plist", path + "/Info.plist");
  ASSERT_TRUE(waitFor([&] { return registry_->registryAppByBundleURL(Url::file(path)) != nullptr; }));
  fs::create_directory(path + "/PlugIns");
  fs::copy(source + "/PlugIns/a.appex", path + "/PlugIns/a.appex", fs::copy_options::recursive);
  ASSERT_TRUE(waitFor([&] { return named("a") != nullptr; }));
  fs::copy(source, path, fs::copy_options::recursive | fs::copy_options::skip_existing);
  ASSERT_TRUE(waitForNames({"a", "filter"}));
  ASSERT_TRUE(waitFor([&] { return named("filter")->entitlements == filter.entitlements; }));
  locale_->changeTo("de");
  ASSERT_TRUE(waitFor([&] { return named("filter")->localizedName == "Deutsch"; }));
  EXPECT_EQ(linesWith("left out " + path + ": no Info.plist"), 1U);
}

TEST_F(BundleRegistryWatchTest, WithoutEnoughWatchesTheFoldersArePolled) {
  options_.mostWatches = 1;
  start();
  EXPECT_EQ(linesWith("there are not enough file watches"), 1U);
  const std::string path = installBundle(apps_, sampleApplication("mail", {samplePlugIn("filter")}));
  ASSERT_TRUE(waitForNames({"filter"}));
  removeBundle(path);
  ASSERT_TRUE(waitForNames({}));
  EXPECT_EQ(linesWith("there are not enough file watches"), 1U) << "once";
}

}  // namespace
}  // namespace platform
