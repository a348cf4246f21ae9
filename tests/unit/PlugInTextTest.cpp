#include "tools/PlugInText.h"

#include <gtest/gtest.h>

#include "tools/OfferedPlugIns.h"
#include "tools/PlugInReference.h"
#include "tools/Table.h"

namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

Dictionary form(const std::string& identifier, const std::string& version, const std::string& uuid) {
  const Dictionary plugIn{{"HXExtensionPointIdentifier", "com.example.point"}, {"HXExtensionAttributes", Dictionary()}};
  return {{"identifier", identifier},
          {"version", version},
          {"uuid", uuid},
          {"path", "/A/" + identifier + ".appex"},
          {"bundleInfo", Dictionary{{"HXExtension", plugIn}}},
          {"info", plugIn},
          {"annotations", Dictionary()}};
}

constexpr const char* kFirst = "00000000-0000-0000-0000-000000000001";
constexpr const char* kSecond = "00000000-0000-0000-0000-000000000002";

TEST(PlugInTextTest, TheTableIsOrderedAlignedAndEscaped) {
  Dictionary newer = form("a", "1.10", kSecond);
  newer.set("localizedDisplayName", "日本\x1b[31m");
  newer.set("overriding", "b");
  newer.set("annotations", Dictionary{{"election", 1}});
  Dictionary overridden = form("b", "1", kFirst);
  overridden.set("overrider", kSecond);
  overridden.set("systemResident", true);

  const auto forms = tools::sortedForms(Array({overridden, newer, form("a", "1.9", kFirst)}));
  EXPECT_EQ(tools::plugInTable(forms),
            "NAME          IDENTIFIER  VERSION  EXTENSION POINT    UUID                                  "
            "FLAGS                   PATH\n"
            "a             a           1.9      com.example.point  00000000-0000-0000-0000-000000000001  "
            "-                       /A/a.appex\n"
            "日本\\x1b[31m  a           1.10     com.example.point  00000000-0000-0000-0000-000000000002  "
            "election=1,overrides=b  /A/a.appex\n"
            "b             b           1        com.example.point  00000000-0000-0000-0000-000000000001  "
            "system,overridden-by=a  /A/b.appex\n");
}

TEST(PlugInTextTest, APageSaysWhatThereIsAlsoOfAFormThatBuildsNoRecord) {
  Dictionary old = form("a", "<none>", kFirst);
  old.set("bundleInfo", Dictionary{{"Extora", Dictionary()}});
  old.set("entitlements", Dictionary{{"com.example.x", true}, {"com.example.y", Array({"z"})}});
  const std::string page = tools::plugInPage(old);
  for (const char* line : {"flags               old-style\n", "extension point     com.example.point\n",
                           "entitlements        com.example.x = true\n", "\n                      com.example.y = "}) {
    EXPECT_NE(page.find(line), std::string::npos) << line << " in\n" << page;
  }
  EXPECT_EQ(page.find("application"), std::string::npos);
}

TEST(PlugInTextTest, APlugInIsNamedByUuidLocationOrIdentifier) {
  using tools::PlugInReference;
  EXPECT_EQ(PlugInReference::parse(kFirst).uuid, platform::Uuid::parse(kFirst));
  EXPECT_EQ(PlugInReference::parse("file:///no%20such/A.appex/").url->path(), "/no such/A.appex");
  EXPECT_EQ(PlugInReference::parse("/no/such/../A.appex/").url->path(), "/no/A.appex");
  EXPECT_TRUE(PlugInReference::parse("./no-such").url->path().ends_with("/no-such"));
  EXPECT_TRUE(PlugInReference::parse("com.example.mail").isIdentifier());
  for (const char* nothing : {"", "http://example.com/A.appex", "file://elsewhere/A.appex"}) {
    EXPECT_NE(tools::plugInReferenceFault(nothing), "") << nothing;
  }
}

// What watch tells: which plug-ins came and went between two looks, and why.
TEST(PlugInTextTest, ChangesBetweenTwoLooks) {
  const auto form = [](const char* uuid, std::int64_t registered, std::int64_t election) -> Value {
    return Dictionary{{"uuid", uuid},
                      {"identifier", std::string("com.") + uuid},
                      {"version", "1"},
                      {"path", "/p"},
                      {"lastmodified", registered},
                      {"extensions", Dictionary{{".", platform::Uuid::random().text()}}},
                      {"annotations", Dictionary{{"election", election}}}};
  };
  tools::OfferedPlugIns offered(100);
  const auto lines = [&](const std::vector<Value>& forms) {
    std::string text;
    for (const auto& change : offered.update(forms, [](const std::string& uuid) { return uuid == "held"; })) {
      text += changeLine(change) + "\n";
    }
    return text;
  };
  EXPECT_EQ(lines({form("held", 50, 0), form("gone", 50, 0), form("kept", 50, 0)}), "") << "the first look";
  EXPECT_EQ(lines({form("held", 50, 0), form("gone", 50, 0), form("kept", 50, 0)}), "") << "fresh tokens alone";
  EXPECT_EQ(lines({form("new", 100, 0), form("old", 99, 0), form("kept", 50, 2)}),
            "removed    com.gone 1  gone  /p\n"
            "withdrawn  com.held 1  held  /p\n"
            "changed    com.kept 1  kept  /p  annotations: {election: 0} -> {election: 2}\n"
            "installed  com.new 1  new  /p\n"
            "offered    com.old 1  old  /p\n");
  (void)lines({});
  EXPECT_EQ(lines({form("new", 100, 0)}), "offered    com.new 1  new  /p\n") << "it was there before";
}

}  // namespace
