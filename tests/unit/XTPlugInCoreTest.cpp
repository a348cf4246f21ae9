#include "Extora/XTPlugInCore.h"

#include <gtest/gtest.h>

#include "Extora/XTDPlugInSignature.h"
#include "platform/value/InternalInconsistency.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"

namespace extora {
namespace {

using Lines = std::vector<std::string>;

const Url kFilter = Url::file("/Applications/Mail.app/PlugIns/Filter.appex");
const Url kPlain = Url::file("/System/PlugIns/Filter.plugin");

Dictionary infoWith(Dictionary plugIn) {
  return {{"HXExtension", std::move(plugIn)}, {"HBBundleDisplayName", "MailFilter"}};
}

std::shared_ptr<XTPlugInCore> record(const Value& info, const Url& url = kFilter) {
  return XTPlugInCore::initWithName("com.example.filter", url, info, {}, std::nullopt);
}

TEST(XTPlugInCore, StylesAreReadFromTheMetadata) {
  for (const auto& [protocol, data] : std::vector<std::pair<Value, bool>>{
           {"#Data", true}, {"#data", false}, {"#Data ", false}, {Array{"#Data"}, false}, {{}, false}}) {
    EXPECT_EQ(record(infoWith({{"HXExtensionProtocol", protocol}}))->isData(), data) << protocol.describe();
  }
  for (const auto& [dedicated, expected] : std::vector<std::pair<Value, bool>>{
           {true, true}, {1, true}, {2.5, true}, {false, false}, {0, false}, {{}, false}, {"true", false}}) {
    EXPECT_EQ(record(infoWith({{"Dedicated", dedicated}}))->isDedicated(), expected) << dedicated.describe();
  }
  EXPECT_TRUE(record(infoWith({{"EmbeddedCode", false}}))->isHybrid());
  EXPECT_FALSE(record(infoWith({}))->isHybrid());

  XTPlugInCore plugIn;
  EXPECT_FALSE(plugIn.setDictionaries(Dictionary{{"Extora", 1}}));
  EXPECT_TRUE(plugIn.oldStyle());
  EXPECT_TRUE(plugIn.setDictionaries(Dictionary{{"Extora", 1}, {"HXExtension", Dictionary{}}}));
  EXPECT_FALSE(plugIn.oldStyle());
  plugIn.setBundleInfoDictionary({});
  EXPECT_THROW((void)plugIn.oldStyle(), platform::InternalInconsistency);
}

TEST(XTPlugInCore, LocalizedInfoForHosts) {
  tests::LogCapture log("default,ar=debug");
  Value answer;
  std::optional<Error> error;
  const auto ask = [&](const XTPlugInCore& plugIn, const std::vector<std::string>& keys) {
    int calls = 0;
    plugIn.localizedInfoDictionaryForKeys(keys, [&](const Value& dictionary, const std::optional<Error>& problem) {
      ++calls;
      answer = dictionary;
      error = problem;
    });
    EXPECT_EQ(calls, 1);
    const Lines lines = log.take();
    EXPECT_EQ(lines.back(), "DEBUG ar: localized values " + answer.describe());
  };

  ask(*record({}), {"HBBundleName"});
  EXPECT_TRUE(answer.isNothing());
  EXPECT_EQ(error, makeError(-1, "Unable to resolve plugin for com.example.filter"));

  Dictionary info = infoWith({});
  info.set("HBBundleName", "filter");
  info.set("Odd", Uuid());
  const auto plugIn = record(info);
  ask(*plugIn, {"HBBundleDisplayName", "HBBundleName", "Nowhere"});
  EXPECT_EQ(error, std::nullopt);
  EXPECT_EQ(answer, Value(Dictionary{{"HBBundleDisplayName", "MailFilter"}, {"HBBundleName", "filter"}}));

  plugIn->setLocalizedName("Mail Filter");
  plugIn->setLocalizedShortName("Filter");
  ask(*plugIn, {"HBBundleDisplayName", "HBBundleName"});
  EXPECT_EQ(answer, Value(Dictionary{{"HBBundleDisplayName", "Mail Filter"}, {"HBBundleName", "Filter"}}));

  ask(*plugIn, {"HBBundleName", "Odd"});
  EXPECT_TRUE(answer.isNothing());
  EXPECT_EQ(error, makeError(-1,
                             "Value of info dictionary key \"Odd\" for plugin com.example.filter does not conform to "
                             "secure coding!"));
}

// Extension points of the tests.
class XTPlugInSDK : public testing::Test {
 protected:
  void SetUp() override {
    XTPlugInCore::setSDKProvider([this](const std::string& point) { return sdks_[point]; });
  }
  void TearDown() override { XTPlugInCore::setSDKProvider(nullptr); }
  std::shared_ptr<XTPlugInCore> resolved(Dictionary plugIn) {
    auto result = record(infoWith(std::move(plugIn)), kPlain);
    result->resolveSDK();
    return result;
  }
  Dictionary sdks_;
};

TEST_F(XTPlugInSDK, FillsWhatThePlugInLacks) {
  sdks_.set("com.example.point", infoWith({{"HXExtensionAttributes", Dictionary{{"A", 2}, {"B", 3}}},
                                           {"HXExtensionProtocol", "P"},
                                           {"CleanTimeout", 30},
                                           {"Shared", Array{"y", "z"}},
                                           {"List", Array{"sdk"}},
                                           {"Clash", Dictionary{}},
                                           {"Clash2", "text"}}));
  const auto plugIn = resolved({{"HXExtensionPointIdentifier", "com.example.point"},
                                {"HXExtensionAttributes", Dictionary{{"A", 1}}},
                                {"CleanTimeout", 10},
                                {"Shared", Array{"x", "y", "x"}},
                                {"List", Array{"own"}},
                                {"Clash", "own"},
                                {"Clash2", Dictionary{}}});
  EXPECT_EQ(plugIn->attributes(), Value(Dictionary{{"A", 1}, {"B", 3}, {"HXExtensionVersion", "1"}}));
  EXPECT_EQ(plugIn->protocolSpec(), Value("P"));
  EXPECT_EQ(plugIn->pluginKey("CleanTimeout"), Value(30));
  EXPECT_EQ(plugIn->pluginKey("Shared"), Value(Array{"x", "y", "z"}));
  EXPECT_EQ(plugIn->pluginKey("List"), Value(Array{"own"}));
  EXPECT_EQ(plugIn->pluginKey("Clash"), Value("own"));
  EXPECT_EQ(plugIn->pluginKey("Clash2"), Value(Dictionary{}));
  EXPECT_EQ(plugIn->infoKey("HXExtension")["HXExtensionProtocol"], Value("P"));
}

TEST_F(XTPlugInSDK, BadOrUnknownKeys) {
  tests::LogCapture log;
  EXPECT_EQ(resolved({{"HXExtensionPointIdentifier", 7}})->version(), std::nullopt);
  EXPECT_EQ(log.take(), Lines{"ERROR ops: invalid SDK key:7"});
  EXPECT_EQ(resolved({{"HXExtensionPointIdentifier", "com.example.none"}})->version(), "1");
  EXPECT_EQ(log.take(), Lines{"DEFAULT ops: plug-in sdk \"com.example.none\" not registered"});
  EXPECT_EQ(resolved({})->version(), "1");
  EXPECT_EQ(log.take(), Lines{});
  EXPECT_THROW(XTPlugInCore().resolveSDK(), platform::InternalInconsistency);
}

TEST(XTDPlugInSignature, EachHasAHashOfItsOwn) {
  const auto a = XTDPlugInSignature::initWithURL(kFilter, nullptr);
  const auto b = XTDPlugInSignature::initWithURL(kFilter, nullptr);
  EXPECT_EQ(a->cdhash().bytes().size(), 20U);
  EXPECT_NE(a->cdhash(), b->cdhash());
  EXPECT_EQ(a->requirement(), "dummy requirement");
}

}  // namespace
}  // namespace extora
