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

TEST(XTPlugInForm, ARecordWithoutVersionStaysWithoutOne) {
  Dictionary info = infoPlist();
  info.set("HXExtension", plugInDictionary({}));
  const Value form = filter(info)->exportForm(nullptr);
  EXPECT_EQ(form["version"], Value("<none>"));
  EXPECT_EQ(XTPlugInCore::initWithForm(form)->version(), std::nullopt);
}

TEST(XTPlugInForm, WhatARecordLacksIsNamed) {
  const auto lacking = [](const XTPlugInCore& plugIn) {
    Error error;
    EXPECT_TRUE(plugIn.exportForm(&error).isNothing());
    EXPECT_EQ(error.domain, "Extora");
    EXPECT_EQ(error.code, 12);
    return error.description.value_or("");
  };
  EXPECT_EQ(lacking({}), "no Info.plist");
  XTPlugInCore plugIn;
  plugIn.setBundleInfoDictionary(Dictionary{});
  EXPECT_EQ(lacking(plugIn), "no path");
  plugIn.setUrl(Url::file("/P"));
  EXPECT_EQ(lacking(plugIn), "no identifier");
  plugIn.setIdentifier("a");
  EXPECT_EQ(lacking(plugIn), "no plug-in dictionary");
  plugIn.setPlugInDictionary(Dictionary{});
  EXPECT_EQ(lacking(plugIn), "no UUID");
  plugIn.setUuid(kUuid);
  EXPECT_EQ(plugIn.exportForm(nullptr)["original-identifier"], Value("a"));
}

TEST(XTPlugInForm, AbsentAndOddEntriesReadBackAsDefaults) {
  const Dictionary least = {{"path", "/P/A.plugin"}, {"identifier", "a"}};
  const auto plugIn = XTPlugInCore::initWithForm(least);
  ASSERT_NE(plugIn, nullptr);
  EXPECT_EQ(plugIn->hubProtocolVersion(), 1U);
  EXPECT_FALSE(plugIn->onSystemVolume());
  EXPECT_EQ(plugIn->lastModified(), 0);
  EXPECT_TRUE(plugIn->plugInDictionary().isNothing());
  EXPECT_EQ(plugIn->originalIdentifier(), std::nullopt);

  Dictionary odd = least;
  for (const char* key : {"entitlements", "annotations", "localizedDisplayName", "localizedDocSourceActionNames",
                          "hash", "requirement", "original-identifier", "containingPath", "uuid"}) {
    odd.set(key, 7);
  }
  odd.set("systemResident", 1);
  odd.set("lastmodified", 4.75);
  const auto other = XTPlugInCore::initWithForm(odd);
  ASSERT_NE(other, nullptr);
  EXPECT_TRUE(other->onSystemVolume());
  EXPECT_EQ(other->lastModified(), 4);
  EXPECT_TRUE(other->entitlements().isNothing());
  EXPECT_TRUE(other->annotations().isNothing());
  EXPECT_TRUE(other->cdhash().isNothing());
  EXPECT_EQ(other->localizedName(), std::nullopt);
  EXPECT_EQ(other->containingUrl(), std::nullopt);
  EXPECT_NE(*other, *XTPlugInCore::initWithForm(odd));

  const auto refused = [&least](const char* key, const Value& value) {
    Dictionary form = least;
    form.set(key, value);
    return XTPlugInCore::initWithForm(form) == nullptr;
  };
  EXPECT_TRUE(refused("path", {}));
  EXPECT_TRUE(refused("identifier", {}));
  EXPECT_TRUE(refused("bundleInfo", Dictionary{{"HXExtension", "text"}}));
  EXPECT_TRUE(refused("bundleInfo", Array{}));
  EXPECT_EQ(XTPlugInCore::initWithForm("no form"), nullptr);
}

TEST(XTPlugInForm, ASecondSetupKeepsOnlyTheContainingUrl) {
  const auto plugIn = filter();
  plugIn->setContainingUrl(Url::file("/Applications/Mail.app"));
  plugIn->setLocalizedName("Mail Filter");
  ASSERT_TRUE(plugIn->setupWithForm(Dictionary{{"path", "/P/A.plugin"}, {"identifier", "a"}}));
  EXPECT_EQ(plugIn->containingPath(), "/Applications/Mail.app");
  EXPECT_EQ(plugIn->localizedName(), std::nullopt);

  plugIn->updateFromForm(Dictionary{{"annotations", Dictionary{{"election", 2}}}, {"identifier", "b"}});
  EXPECT_EQ(plugIn->annotations()["election"], Value(2));
  EXPECT_EQ(plugIn->identifier(), "a");
  plugIn->updateFromForm(Dictionary{});
  EXPECT_TRUE(plugIn->annotations().isNothing());
}

TEST(XTPlugInForm, DiagnoseNamesTheFirstProblem) {
  const Value attributes = Dictionary{};
  const auto diagnosis = [](const char* identifier, const char* path, Dictionary plugIn) {
    XTPlugInCore subject;
    subject.setIdentifier(identifier);
    subject.setUrl(Url::file(path));
    subject.setPlugInDictionary(std::move(plugIn));
    const std::optional<Error> error = subject.diagnose();
    if (!error) return std::string();
    EXPECT_EQ(error->domain, "Extora");
    EXPECT_EQ(error->code, 12);
    return error->description.value_or("no description");
  };
  EXPECT_EQ(diagnosis("", "/A.plugin", {}),
            "missing identifier (no HXExtensionIdentifier, nor even HBBundleIdentifier)");
  EXPECT_EQ(diagnosis("a", "/A.plugin", {}), "missing \"HXExtensionProtocol\" key in Info.plist or SDK");
  EXPECT_EQ(diagnosis("a", "/A.appex", {}), "missing \"HXExtensionAttributes\" key in Info.plist or SDK");
  EXPECT_EQ(diagnosis("a", "/A.appex", {{"HXExtensionAttributes", "text"}}),
            "missing \"HXExtensionAttributes\" key in Info.plist or SDK");
  EXPECT_EQ(diagnosis("a", "/A.appex",
                      {{"HXExtensionAttributes", attributes}, {"PrincipalClass", "Other"}, {"PassProxy", 1}}),
            "Application Extensions may not use the \"PrincipalClass\" key");
  EXPECT_EQ(diagnosis("a", "/A.appex", {{"HXExtensionAttributes", attributes}, {"PassProxy", 1}, {"EmbeddedCode", 1}}),
            "the \"PassProxy\" key is not supported on this platform");
  EXPECT_EQ(diagnosis("a", "/A.appex", {{"HXExtensionAttributes", attributes}, {"EmbeddedCode", 1}}),
            "hybrid plug-ins are not supported on this platform");
  EXPECT_EQ(diagnosis("a", "/A.appex", {{"HXExtensionAttributes", attributes}, {"PrincipalClass", "HXObject"}}), "");
  EXPECT_EQ(
      diagnosis("a", "/A.plugin",
                {{"HXExtensionAttributes", attributes}, {"HXExtensionProtocol", "P"}, {"PrincipalClass", "Other"}}),
      "");
}

}  // namespace
}  // namespace extora
