#include "platform/registry/BundleRegistry.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <fstream>

#include "tests/support/RegistryFixture.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using tests::sampleApplication;
using tests::SampleBundle;
using tests::samplePlugIn;
using tests::writeBundle;

class BundleRegistryTest : public tests::RegistryFixture {
 protected:
  std::string containerOf(const std::string& identifier) const {
    const PlugInRecord record = named(identifier);
    if (record == nullptr || !record->dataContainerURL) return "none";
    return record->dataContainerURL->path();
  }
  std::string container(const std::string& name) const { return options_.directories.state + "/Containers/" + name; }
};

TEST_F(BundleRegistryTest, ARestartKeepsWhatIsUnchangedWithoutReadingIt) {
  const std::string mail =
      writeBundle(apps_, sampleApplication("mail", {samplePlugIn("filter"), samplePlugIn("other")}));
  writeBundle(apps_, sampleApplication("gone", {samplePlugIn("gone.plugin")}));
  start();
  const PlugInRecord filter = named("filter");
  const PlugInRecord other = named("other");
  const auto knowledge = registry_->registryKnowledgeUUID();
  EXPECT_EQ(registry_->registryKnowledgeUUID(), knowledge);
  registry_.reset();

  // Nonsense of the same state as before shows that nothing is parsed.
  const std::string info = mail + "/PlugIns/filter.appex/Info.plist";
  const auto time = fs::last_write_time(info);
  {
    std::fstream file(info);
    file << "nonsense";
  }
  fs::last_write_time(info, time);
  tests::writePropertyList(mail + "/PlugIns/other.appex/Info.plist",
                           Dictionary{{"HBBundleIdentifier", "other"}, {"HXExtension", Dictionary{}}});
  fs::remove_all(apps_ + "/gone.app");
  start();
  EXPECT_EQ(names(), (Names{"filter", "other"}));
  EXPECT_EQ(named("filter")->plugInUUID, filter->plugInUUID);
  EXPECT_EQ(named("filter")->registrationDate, filter->registrationDate);
  EXPECT_EQ(named("filter")->infoDictionary, filter->infoDictionary);
  EXPECT_NE(named("other")->plugInUUID, other->plugInUUID);
  EXPECT_NE(registry_->registryKnowledgeUUID(), knowledge);

  // Without its memory it knows the same, registered anew.
  registry_.reset();
  tests::writePropertyList(info, filter->infoDictionary);
  std::ofstream(options_.directories.state + "/registry.sqlite") << "no database any more";
  fs::remove(options_.directories.state + "/registry.sqlite-wal");
  start();
  EXPECT_EQ(names(), (Names{"filter", "other"}));
  EXPECT_NE(named("filter")->plugInUUID, filter->plugInUUID);
  EXPECT_TRUE(fs::exists(options_.directories.state + "/registry.sqlite.damaged"));
}

TEST_F(BundleRegistryTest, APlugInHasAPrivateContainerUnlessItIsDataOnlyOrItsNameForbidsIt) {
  SampleBundle data = samplePlugIn("data");
  tests::setPlugInKey(data, "HXExtensionProtocol", "#Data");
  writeBundle(apps_, sampleApplication("mail", {samplePlugIn("filter"), data, samplePlugIn("com.orvane.xtd"),
                                                samplePlugIn("x", {{"HXExtensionIdentifier", "../up"}})}));
  start();
  EXPECT_EQ(containerOf("filter"), container("filter"));
  for (const std::string& each : {container("filter"), container("filter") + "/tmp"}) {
    struct stat status {};
    ASSERT_EQ(::lstat(each.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode, S_IFDIR | 0700U);
  }
  EXPECT_EQ(containerOf("data"), "none");
  EXPECT_EQ(containerOf("com.orvane.xtd"), "none");
  EXPECT_EQ(containerOf("../up"), "none");
  EXPECT_EQ(std::distance(fs::directory_iterator(container("")), {}), 1);

  // A container that was lost is made again at the next start.
  fs::remove_all(container("filter"));
  start();
  EXPECT_TRUE(fs::is_directory(container("filter") + "/tmp"));
}

TEST_F(BundleRegistryTest, AContainerBelongsToTheApplicationThatGotItFirst) {
  const auto application = [](const char* name, const char* identifier) {
    SampleBundle bundle = sampleApplication(identifier, {samplePlugIn("x"), samplePlugIn("own")});
    bundle.name = name;
    return bundle;
  };
  const auto at = [&](const std::string& name) {
    const PlugInRecord record = registry_->registryPlugInByURL(Url::file(apps_ + "/" + name + "/PlugIns/x.appex"));
    return record == nullptr ? "nothing" : record->dataContainerURL->path();
  };
  writeBundle(apps_, application("b.app", "com.b"));
  start();
  EXPECT_EQ(at("b.app"), container("x"));
  writeBundle(apps_, application("a.app", "com.a"));
  writeBundle(apps_, application("c.app", "com.b"));  // the name alone gives no right to anything
  start();
  EXPECT_EQ(at("a.app"), container("x@2"));
  EXPECT_EQ(at("b.app"), container("x"));
  EXPECT_EQ(at("c.app"), container("x@3"));

  // Removed and installed again, or moved: the same; but not for another application in its place.
  fs::remove_all(apps_ + "/b.app");
  fs::rename(apps_ + "/a.app", apps_ + "/d.app");
  start();
  EXPECT_EQ(at("d.app"), container("x@2"));
  writeBundle(apps_, application("b.app", "com.other"));
  start();
  EXPECT_EQ(at("b.app"), container("x@4"));
  fs::remove_all(apps_ + "/b.app");
  fs::remove_all(apps_ + "/c.app");
  start();
  writeBundle(apps_, application("b.app", "com.b"));
  start();
  EXPECT_EQ(at("b.app"), container("x"));
}

TEST_F(BundleRegistryTest, FollowsTheLocale) {
  SampleBundle filter = samplePlugIn("filter");
  filter.tables["de/InfoPlist"] = {{"HBBundleDisplayName", "Filter (de)"}};
  filter.tables["de/Localizable"] = {{"open", "Öffnen"}, {"close", "Schließen"}, {"number", 1}};
  filter.tables["de_CH/Localizable"] = {{"close", "Schliessen"}};
  SampleBundle mail = sampleApplication("mail", {filter, samplePlugIn("plain")});
  mail.tables["de/InfoPlist"] = {{"HBBundleName", "Post"}};
  writeBundle(apps_, mail);
  start();
  const auto values = [&] {
    return Value(
        registry_->registryLocalizedValues(named("filter"), {"open", "close", "number", "none"}, "Localizable"));
  };
  const PlugInRecord before = named("filter");
  const PlugInRecord plain = named("plain");
  EXPECT_EQ(before->localizedName, "filter");
  EXPECT_EQ(values(), Value(Dictionary{}));
  const auto knowledge = registry_->registryKnowledgeUUID();

  locale_->changeTo("de_CH.UTF-8");
  EXPECT_NE(registry_->registryKnowledgeUUID(), knowledge) << "before anybody else is told";
  EXPECT_EQ(named("filter")->localizedName, "Filter (de)");
  EXPECT_EQ(named("filter")->localizedShortName, "filter");
  EXPECT_EQ(named("filter")->containingApplication->localizedName, "Post");
  EXPECT_EQ(named("filter")->plugInUUID, before->plugInUUID);
  EXPECT_EQ(named("filter")->dataContainerURL, before->dataContainerURL);
  EXPECT_EQ(before->localizedName, "filter") << "a record that somebody holds stays as it was";
  EXPECT_EQ(named("plain")->containingApplication->localizedName, "Post");
  EXPECT_EQ(values(), Value(Dictionary{{"open", "Öffnen"}, {"close", "Schliessen"}}));
  EXPECT_EQ(Value(registry_->registryLocalizedValues(named("filter"), {"open"}, "../de/Localizable")),
            Value(Dictionary{}));

  const std::string table = apps_ + "/mail.app/PlugIns/filter.appex/Localization/de/Localizable.plist";
  tests::writePropertyList(table, Dictionary{{"open", "Auf"}});
  EXPECT_EQ(values()["open"], Value("Auf"));
  fs::remove(table);
  fs::create_symlink("/etc/passwd", table);
  EXPECT_EQ(values(), Value(Dictionary{{"close", "Schliessen"}}));

  // A start in another language than the last knows the names without reading.
  locale_->lang = "C";
  start();
  EXPECT_EQ(named("filter")->localizedName, "filter");
  locale_->changeTo("de");
  EXPECT_EQ(named("filter")->localizedName, "Filter (de)");
  EXPECT_TRUE(observer_->take().empty());
}

TEST_F(BundleRegistryTest, AnswersSdkDictionariesOfTheSystemBeforeThoseOfApplications) {
  const Value own = Dictionary{{"HXExtension", Dictionary{{"CleanTimeout", 30}}}};
  const Value theirs = Dictionary{{"HXExtension", Dictionary{{"CleanTimeout", 5}}}};
  SampleBundle mail = sampleApplication("mail");
  mail.info.set("HXExtensionPoints", Dictionary{{"com.example.point", theirs}, {"com.example.mail", theirs}});
  mail.info.set("HXTypeDeclarations",
                Array{Value(Dictionary{{"HXTypeIdentifier", "letter"}, {"HXTypeConformsTo", "text"}})});
  writeBundle(apps_, mail);
  const std::string file = directory_.path("points/com.example.point.plist");
  tests::writePropertyList(file, own);
  tests::writePropertyList(directory_.path("secret.plist"), own);
  start();
  EXPECT_EQ(registry_->registryExtensionPointSDK("com.example.point"), own);
  EXPECT_EQ(registry_->registryExtensionPointSDK("com.example.mail"), theirs);
  EXPECT_TRUE(registry_->registryExtensionPointSDK("com.example.none").isNothing());
  EXPECT_TRUE(registry_->registryExtensionPointSDK("../secret").isNothing());
  EXPECT_TRUE(registry_->typeConformsTo("letter", "text"));
  EXPECT_TRUE(registry_->evaluateActivationRule(
      Dictionary{{"text", 1}}, Dictionary{{"items", Array{Value(Dictionary{{"types", Array{Value("letter")}}})}}}));

  std::ofstream(file) << "broken";
  EXPECT_EQ(registry_->registryExtensionPointSDK("com.example.point"), theirs);
  EXPECT_EQ(registry_->registryExtensionPointSDK("com.example.point"), theirs);
  EXPECT_EQ(log_.take().size(), 1U) << "once per change of the file";
  fs::remove(file);
  EXPECT_EQ(registry_->registryExtensionPointSDK("com.example.point"), theirs);
}

TEST_F(BundleRegistryTest, RefusesToRegisterWhatIsNoTrustedPlugIn) {
  const std::string mail = writeBundle(directory_.path(), sampleApplication("mail", {samplePlugIn("filter")}));
  const std::string filter = mail + "/PlugIns/filter.appex";
  const std::string linked = directory_.path("linked.appex");
  fs::create_directory_symlink(filter, linked);
  const auto refuses = [&](const std::string& path) {
    const bool refused = registry_->registryRegisterPlugin(Url::file(path)).has_value();
    return refused && names().empty() && registry_->registryInstalledPlugIns().empty();
  };
  start();
  EXPECT_TRUE(refuses(mail)) << "no plug-in";
  EXPECT_TRUE(refuses(directory_.path("missing.appex")));
  EXPECT_TRUE(refuses(directory_.path()));
  for (const std::string& each : {filter + "/Info.plist", filter + "/plugin", filter, mail + "/Info.plist"}) {
    fs::permissions(each, fs::perms::group_write, fs::perm_options::add);
    EXPECT_TRUE(refuses(filter)) << each;
    fs::permissions(each, fs::perms::group_write, fs::perm_options::remove);
  }
  start();
  EXPECT_TRUE(names().empty()) << "nothing of it is remembered";
  EXPECT_EQ(registry_->registryRegisterPlugin(Url::file(linked)), std::nullopt);
  EXPECT_EQ(named("filter")->bundleURL->path(), filter) << "paths of records are canonical";
}

}  // namespace
}  // namespace platform
