#include <gtest/gtest.h>

#include "tests/support/TestServer.h"

namespace extora {
namespace {

using platform::Array;

class XTDPlugInAccessTest : public ::testing::Test {
 protected:
  // The reason why a host with `entitlements` may not use the plug-in; "" when it may.
  std::string refusal(const XTDPlugIn& plugIn, const Dictionary& entitlements) {
    test_.rights->entitlements = entitlements;
    return plugIn.allowForClient(*client_).value_or("");
  }

  tests::TestServer test_;
  std::shared_ptr<tests::FakeConnection> connection_ = std::make_shared<tests::FakeConnection>();
  std::shared_ptr<XTDIpcClient> client_ = test_.connect(connection_);
};

TEST_F(XTDPlugInAccessTest, TheHostsRestriction) {
  const auto plugIn = test_.install(tests::sampleRecord("com.a"));
  const std::string key(XTAllowedPlugInsEntitlement);
  const std::string unmatched = "the host's plug-in entitlement does not allow this plug-in";
  EXPECT_EQ(refusal(*plugIn, {}), "");
  for (const Value& invalid : {Value("com.a"), Value(Array{"com.a"}), Value(true), Value(false)}) {
    EXPECT_EQ(refusal(*plugIn, {{key, invalid}}), "invalid host restriction entitlement");
  }
  EXPECT_EQ(refusal(*plugIn, {{key, Dictionary()}}), "");
  EXPECT_EQ(refusal(*plugIn, {{key, Dictionary{{"HXExtensionIdentifier", "com.a"}}}}), "");
  EXPECT_EQ(refusal(*plugIn, {{key, Dictionary{{"HXExtensionIdentifier", "com.b"}}}}), unmatched);
}

TEST_F(XTDPlugInAccessTest, ThePlugInsRequirement) {
  platform::ARExtoraProxy record = tests::sampleRecord("com.a");
  const auto requiring = [&](const Value& required) {
    record.plugInUUID = Uuid::random();
    tests::setPlugInDictionary(record,
                               {{"HXExtensionAttributes", Dictionary()}, {"HXExtensionHostEntitlement", required}});
    return test_.install(record);
  };
  const auto plugIn = requiring("com.needed");
  const std::string refused = "the host does not have the \"com.needed\" entitlement";
  for (const Value& held : {Value(true), Value("text"), Value(Array()), Value(1)}) {
    EXPECT_EQ(refusal(*plugIn, {{"com.needed", held}}), "") << held.describe();
  }
  for (const Value& missing : {Value(), Value(false), Value(0)}) {
    EXPECT_EQ(refusal(*plugIn, {{"com.needed", missing}}), refused) << missing.describe();
  }
  const Dictionary allowed{{XTAllowedPlugInsEntitlement, Dictionary{{"HXExtensionIdentifier", "com.a"}}}};
  EXPECT_EQ(refusal(*plugIn, allowed), refused) << "a restriction that the plug-in satisfies does not replace it";
  EXPECT_EQ(refusal(*requiring(7), {{"7", true}}), "the host does not have the \"7\" entitlement")
      << "what is no name cannot be held";
}

}  // namespace
}  // namespace extora
