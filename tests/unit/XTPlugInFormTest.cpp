#include <gtest/gtest.h>

#include "Extora/XTPlugInCore.h"
#include "tests/support/PrintDescribed.h"

namespace extora {
namespace {

const Uuid kUuid = *Uuid::parse("8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8");

Dictionary plugInDictionary(const Value& version = "1.2") {
  return {{"HXExtensionAttributes", Dictionary{{"HXExtensionVersion", version}, {"Other", true}}}};
}

Dictionary infoPlist() {
  return {{"HXExtension", plugInDictionary()},
          {"HBBundleDisplayName", "MailFilter"},
          {"HBBundleInfoPlistURL", "file:///Applications/Mail.app/PlugIns/Filter.appex/Info.plist"}};
}

std::shared_ptr<XTPlugInCore> filter(const Value& info = infoPlist()) {
  auto plugIn = XTPlugInCore::initWithName("com.example.filter",
                                           Url::file("/Applications/Mail.app/PlugIns/Filter.appex"), info, {}, kUuid);
  plugIn->setOriginalIdentifier("com.example.original");
  plugIn->setLastModified(-5);
  plugIn->setHubProtocolVersion(2);
  return plugIn;
}

TEST(XTPlugInForm, HasExactlyItsEntries) {
  const auto plugIn = filter();
  const Dictionary shown = {{"HXExtension", plugInDictionary()}, {"HBBundleDisplayName", "MailFilter"}};
  Dictionary expected = {{"hubProtocolVersion", 2U},
                         {"path", "/Applications/Mail.app/PlugIns/Filter.appex"},
                         {"systemResident", false},
                         {"identifier", "com.example.filter"},
                         {"original-identifier", "com.example.original"},
                         {"version", "1.2"},
                         {"bundleInfo", shown},
                         {"info", plugInDictionary()},
                         {"uuid", "8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8"},
                         {"lastmodified", -5},
                         {"annotations", Dictionary{}}};
  const Value form = plugIn->exportForm(nullptr);
  EXPECT_EQ(form, Value(expected)) << form.describe();
  EXPECT_EQ(form["hubProtocolVersion"].kind(), platform::Kind::Unsigned);
  EXPECT_EQ(form["lastmodified"].kind(), platform::Kind::Signed);
  EXPECT_EQ(form["systemResident"].kind(), platform::Kind::Boolean);

  plugIn->setAnnotation("election", 1);
  plugIn->setEntitlements(Dictionary{});
  plugIn->setContainingUrl(Url::file("/Applications/Mail.app"));
  plugIn->setLocalizedContainingName("Post");
  plugIn->setLocalizedName("Mail Filter");
  plugIn->setLocalizedShortName("Filter");
  plugIn->setLocalizedDocSourceActionNames(Dictionary{{"open", "Open"}});
  plugIn->setCdhash(Value::data({1}));
  plugIn->setRequirement("anchor");
  expected.set("annotations", Dictionary{{"election", 1}});
  expected.set("bundleInfo", Dictionary{{"HXExtension", plugInDictionary()}, {"HBBundleDisplayName", "Mail Filter"}});
  expected.set("entitlements", Dictionary{});
  expected.set("containingPath", "/Applications/Mail.app");
  expected.set("localizedContainingDisplayName", "Post");
  expected.set("localizedDisplayName", "Mail Filter");
  expected.set("localizedShortName", "Filter");
  expected.set("localizedDocSourceActionNames", Dictionary{{"open", "Open"}});
  EXPECT_EQ(plugIn->exportForm(nullptr), Value(expected));
  EXPECT_EQ(plugIn->bundleInfoDictionary(), Value(infoPlist()));

  const auto back = XTPlugInCore::initWithForm(expected);
  ASSERT_NE(back, nullptr);
  EXPECT_EQ(*back, *plugIn);
  EXPECT_EQ(back->exportForm(nullptr), Value(expected));
  EXPECT_TRUE(back->cdhash().isNothing());
  EXPECT_EQ(back->requirement(), std::nullopt);
}

}  // namespace
}  // namespace extora
