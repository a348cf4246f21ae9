#include "tools/PlugInText.h"

#include <gtest/gtest.h>

#include "tools/PlugInReference.h"
#include "tools/Table.h"

namespace {

using platform::Array;
using platform::Dictionary;

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

}  // namespace
