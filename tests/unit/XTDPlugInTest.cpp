#include "xtd/XTDPlugIn.h"

#include <gtest/gtest.h>

#include "tests/support/FakeRegistry.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"

namespace extora {
namespace {

using platform::ARExtoraProxy;
using platform::Array;
using tests::sampleRecord;
using tests::setPlugInDictionary;

class XTDPlugInTest : public ::testing::Test {
 protected:
  /// Installs the record in the place of an earlier one of its UUID.
  std::shared_ptr<XTDPlugIn> make(const ARExtoraProxy& record) {
    registry_->uninstall(*record.plugInUUID, false);
    return XTDPlugIn::initWithARData(registry_->install(record), registry_, {});
  }
  std::shared_ptr<XTDPlugIn> makeOutside(ARExtoraProxy record, const char* path) {
    registry_->uninstall(*record.plugInUUID, false);
    record.bundleURL = Url::file(path);
    return XTDPlugIn::initWithARData(platform::plugInRecord(registry_->install(std::nullopt, {record}), 0), registry_,
                                     {});
  }
  int lookups() { return registry_->lookups.exchange(0); }

  std::shared_ptr<tests::FakeRegistry> registry_ = std::make_shared<tests::FakeRegistry>();
};

TEST_F(XTDPlugInTest, RefusesWhatItsSelfCheckRefuses) {
  tests::LogCapture log("info");
  ARExtoraProxy record = sampleRecord("com.a");
  EXPECT_TRUE(makeOutside(record, "/System/PlugIns/com.a.appex"));
  EXPECT_FALSE(makeOutside(record, "/SystemX/com.a.appex"));
  EXPECT_EQ(log.take(), std::vector<std::string>({"INFO ops: ignoring mis-configured plug-in at /SystemX/com.a.appex: "
                                                  "plug-ins outside containing apps must be in /System"}));
  record.dataContainerURL.reset();
  EXPECT_FALSE(make(record));
  EXPECT_EQ(log.take(), std::vector<std::string>({"INFO ops: ignoring mis-configured plug-in at "
                                                  "/Apps/com.a.app/PlugIns/com.a.appex: "
                                                  "this plug-in has no sandbox data container"}));
  setPlugInDictionary(record, {{"HXExtensionAttributes", Dictionary()}, {"HXExtensionProtocol", "#Data"}});
  EXPECT_TRUE(make(record)) << "a data plug-in needs no container";
  setPlugInDictionary(record, {{"HXExtensionProtocol", "#Data"}});
  EXPECT_FALSE(make(record)) << "the base's checks come first";
  record = sampleRecord("com.a");
  record.bundleURL.reset();
  EXPECT_FALSE(make(record));
  record = sampleRecord("");
  EXPECT_FALSE(make(record)) << "no identifier";
}

TEST_F(XTDPlugInTest, HubProtocolVersion) {
  ARExtoraProxy record = sampleRecord("com.a");
  EXPECT_EQ(make(record)->hubProtocolVersion(), 2U);
  Dictionary info(record.infoDictionary);
  info.set("Extora", Dictionary());
  record.infoDictionary = info;
  EXPECT_EQ(make(record)->hubProtocolVersion(), 1U);
  setPlugInDictionary(record, {{"HXExtensionAttributes", Dictionary()}, {"HubProtocolVersion", 3}});
  EXPECT_EQ(make(record)->hubProtocolVersion(), 3U);
}

TEST_F(XTDPlugInTest, OneStampMarksEveryValueCurrent) {
  const auto plugIn = make(sampleRecord("com.a"));
  EXPECT_EQ(lookups(), 1) << "the first read after construction refreshes";
  EXPECT_EQ(plugIn->localizedName(), "com.a name");
  EXPECT_EQ(plugIn->localizedShortName(), "com.a short");
  EXPECT_EQ(lookups(), 2) << "absent fields are read even under a current stamp";
  EXPECT_EQ(plugIn->localizedName(), "com.a name");
  EXPECT_TRUE(plugIn->infoKey("HXExtension"));
  EXPECT_EQ(lookups(), 0);

  registry_->touch();
  plugIn->setLocalizedShortName("old");
  EXPECT_EQ(plugIn->localizedName(), "com.a name");
  EXPECT_EQ(plugIn->localizedShortName(), "old") << "marked current by the other getter";
  EXPECT_TRUE(plugIn->infoKey("HXExtension"));
  EXPECT_EQ(lookups(), 1);
  EXPECT_EQ(plugIn->arKnowledgeUUID(), registry_->knowledge);

  registry_->knowledge.reset();
  EXPECT_TRUE(plugIn->infoKey("HXExtension"));
  EXPECT_TRUE(plugIn->infoKey("HXExtension"));
  EXPECT_EQ(lookups(), 2) << "without a stamp every read refreshes";
}

TEST_F(XTDPlugInTest, AnUninstalledPlugInAnswersEmptyValues) {
  const auto plugIn = make(sampleRecord("com.a"));
  EXPECT_EQ(plugIn->localizedName(), "com.a name");
  registry_->uninstall(plugIn->uuid(), false);
  tests::LogCapture log;
  (void)lookups();
  EXPECT_TRUE(plugIn->bundleInfoDictionary().isNothing());
  EXPECT_EQ(log.take(),
            std::vector<std::string>({"DEFAULT ar: Failed to find Plugin by " + plugIn->uuid().text() +
                                          " fallback to path file:///Apps/com.a.app/PlugIns/com.a.appex",
                                      "ERROR ops: could not obtain fresh proxy for " + plugIn->uuid().text()}));
  EXPECT_TRUE(plugIn->bundleInfoDictionary().isNothing());
  EXPECT_EQ(lookups(), 2) << "a failed refresh is not retried under the same stamp";
  registry_->touch();
  EXPECT_EQ(plugIn->localizedName(), "");
  EXPECT_EQ(plugIn->localizedDocSourceActionNames(), Value(Dictionary()));
}

TEST_F(XTDPlugInTest, DocumentSourceActionNames) {
  registry_->localized["Localizable"] = {{"open", "Open it"}};
  tests::LogCapture log;
  ARExtoraProxy record = sampleRecord("com.a");
  EXPECT_EQ(make(record)->localizedDocSourceActionNames(), Value(Dictionary()));
  EXPECT_EQ(log.take(), std::vector<std::string>({"DEFAULT ar: no actions found in xtdict"}));
  const char* nameKey = "HXExtensionDocSourceActionName";
  setPlugInDictionary(record, {{"HXExtensionAttributes", Dictionary()},
                               {"HXExtensionDocSourceActions",
                                Array{Dictionary{{nameKey, "open"}}, Dictionary(), Dictionary{{nameKey, "save"}}}}});
  const auto plugIn = make(record);
  EXPECT_EQ(plugIn->localizedDocSourceActionNames(), Value(Dictionary{{"open", "Open it"}, {"save", "save"}}));
  EXPECT_EQ(log.take(), std::vector<std::string>({"ERROR ar: missing HXExtensionDocSourceActionName for plugin "
                                                  "com.a at /Apps/com.a.app/PlugIns/com.a.appex"}));
}

}  // namespace
}  // namespace extora
