// Discovery end to end: which of the installed plug-ins a host is offered, and in which form.
#include <gtest/gtest.h>

#include "Extora/XTProtocol.h"
#include "Extora/XTVocabulary.h"
#include "platform/ipc/IpcCodec.h"
#include "platform/value/Url.h"
#include "tests/support/Daemon.h"
#include "tests/support/SampleBundles.h"

namespace extora {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using tests::sampleApplication;
using tests::SampleBundle;
using tests::samplePlugIn;

using Texts = std::vector<std::string>;

SampleBundle versioned(const std::string& identifier, const std::string& version) {
  return samplePlugIn(identifier, {{XTVersionAttribute, version}});
}

class DiscoveryTest : public ::testing::Test {
 protected:
  /// Writes an application of these plug-ins into a folder of the daemon that is to be started.
  std::string write(const std::filesystem::path& folder, const std::string& name, std::vector<SampleBundle> plugIns) {
    return tests::writeBundle(folder, sampleApplication("com.example." + name, std::move(plugIns)));
  }
  /// What this process is offered.
  Texts match(std::uint64_t flags = 0, const Dictionary& rules = {}) { return daemon_.connect().offered(rules, flags); }
  void setExclusions(const Value& exclusions) {
    tests::writePropertyList(daemon_.config() / "preferences" / "com.orvane.extora.userprefs.plist",
                             Dictionary{{XTExclusionsPreferenceKey, exclusions}});
  }

  tests::Daemon daemon_;
};

TEST_F(DiscoveryTest, AFormTellsAllAboutAPlugIn) {
  auto filter = versioned("com.example.filter", "2.5");
  filter.entitlements = Dictionary{{"com.example.right", true}};
  filter.info.set("HBBundleDisplayName", "Mail Filter");
  const auto application = write(daemon_.applications(), "mail", {filter});
  daemon_.start();
  const auto forms = daemon_.connect().match({});
  ASSERT_EQ(forms.size(), 1U);
  const Value& form = forms[0];
  EXPECT_EQ(form["path"].string(), application + "/PlugIns/filter.appex");
  EXPECT_EQ(form["containingPath"].string(), application);
  EXPECT_EQ(form["version"].string(), "2.5");
  EXPECT_EQ(form["localizedDisplayName"].string(), "Mail Filter");
  EXPECT_TRUE(form["systemResident"] == Value(false));
  EXPECT_TRUE(form["annotations"] == Value(Dictionary()));
  EXPECT_TRUE(form["entitlements"] == filter.entitlements);
  EXPECT_EQ(form["bundleInfo"]["HBBundleIdentifier"].string(), "com.example.filter");
  EXPECT_TRUE(platform::Uuid::parse(form["uuid"].string()));
  EXPECT_GT(form["lastmodified"].exactSigned(), 1'600'000'000);
  const std::string& uuid = form["uuid"].string();
  EXPECT_TRUE(
      daemon_.waitForLog("INFO ops: Candidate plugin count: 1, info: [\"com.example.filter(2.5) " + uuid + "\"]\n"));
  EXPECT_TRUE(daemon_.waitForLog("INFO ops: Resulting plugin count: 1, UUIDs: [\"" + uuid + "\"]\n"));
  EXPECT_EQ(match(0, {{"x", "y"}}), Texts());
  EXPECT_TRUE(daemon_.waitForLog("INFO ops: Resulting plugin count: 0\n"));
}

TEST_F(DiscoveryTest, PlugInsAreNamedByUuidElseByPathAndALocationBeforeAUuid) {
  const auto folder =
      write(daemon_.applications(), "a", {samplePlugIn("com.example.x"), samplePlugIn("com.example.y")});
  daemon_.start();
  auto client = daemon_.connect();
  const auto uuidOf = [&](const char* identifier) {
    return *platform::Uuid::parse(client.match({{XTIdentifierAttribute, identifier}})[0]["uuid"].string());
  };
  const Value x = uuidOf("com.example.x");
  const Value y = uuidOf("com.example.y");
  const Value unknown = platform::Uuid::random();
  const std::string pathOfY = folder + "/PlugIns/y.appex";
  const std::string notFound = "4 no such plugin (uuid not found)";
  const std::string looked = "INFO traffic: Failed to find plugin by " + unknown.uuid().text() + "\n";
  const std::string byPath = "INFO traffic: Looking for plugin " + unknown.uuid().text() + " by path ";
  const struct {
    Value uuids, paths;
    std::string failure, line;
  } cases[] = {
      {Value(), Value(), "4 invalid request format (uuid)", ""},
      {x, Value(), "4 invalid request format (uuid)", ""},
      {Array{x, x.uuid().text()}, Value(), "4 invalid request (bad uuid array)", ""},
      {Array{x, unknown}, Value(), notFound, ""},
      {Array{unknown}, "/x", notFound, "DEFAULT traffic: Paths present but not an array (ignoring values)\n"},
      {Array{unknown, x}, Array{"/1", "/2", "/3"}, notFound,
       "DEFAULT traffic: Paths present but has different count than UUIDs (ignoring)\n"},
      {Array{unknown}, Array{7}, notFound, looked},
      {Array{unknown}, Array{"/none"}, notFound, byPath + "/none\n"},
      {Array{x, unknown}, Array{"/x", pathOfY}, "", byPath + pathOfY + "\n"},
  };
  for (const auto& each : cases) {
    SCOPED_TRACE(each.uuids.describe() + " " + each.paths.describe());
    const Value reply = client.request("access", {{"uuids", each.uuids}, {"paths", each.paths}});
    EXPECT_EQ(tests::failureOf(reply), each.failure);
    EXPECT_EQ(reply["extensions"].size(), each.failure.empty() ? 2U : 0U);
    EXPECT_TRUE(daemon_.waitForLog(each.line));
  }
  const auto find = [&](const Value& uuid, const Value& location) {
    const Value reply = client.request("find", {{"uuids", uuid}, {"paths", location}});
    if (!reply["matches"]) return tests::failureOf(reply);
    return platform::fromWireMessage(reply["matches"])["identifier"].string();
  };
  EXPECT_EQ(find(x, {}), "com.example.x");
  EXPECT_EQ(find(x, platform::Url::file(pathOfY).absoluteString()), "com.example.y");
  for (const char* none : {"file:///unknown", "/none"}) EXPECT_EQ(find(x, none), "15 Cannot locate PlugIn") << none;
  EXPECT_EQ(find(y.uuid().text(), y), "15 Cannot locate PlugIn") << "each of the other's type";
}

TEST_F(DiscoveryTest, TheNewestVersionIsOfferedUnlessMoreAreAskedFor) {
  write(daemon_.applications(), "a", {versioned("com.example.x", "1.9")});
  write(daemon_.applications(), "b", {versioned("com.example.x", "1.10")});
  write(daemon_.applications(), "c", {versioned("com.example.x", "1.010"), versioned("com.example.y", "1")});
  daemon_.start();
  const auto versions = [&](std::uint64_t flags) {
    return match(flags, {{XTIdentifierAttribute, "com.example.x"}}).size();
  };
  EXPECT_EQ(match().size(), 2U);
  EXPECT_TRUE(match()[0] == "com.example.x 1.10" || match()[0] == "com.example.x 1.010") << match()[0];
  EXPECT_EQ(versions(0), 1U);
  EXPECT_EQ(versions(XTDiscoverDuplicates), 1U);
  EXPECT_EQ(versions(XTDiscoverAllVersions), 2U);
  EXPECT_EQ(versions(XTDiscoverAllVersions | XTDiscoverDuplicates), 3U);
}

TEST_F(DiscoveryTest, TheSystemsOwnPlugInWinsAgainstAnEqualOne) {
  write(daemon_.applications(), "a", {versioned("com.example.x", "1"), versioned("com.example.y", "2")});
  write(daemon_.systemApplications(), "b", {versioned("com.example.x", "1"), versioned("com.example.y", "1")});
  daemon_.start();
  EXPECT_EQ(match(), Texts({"com.example.x 1", "com.example.y 2"}));
  EXPECT_EQ(match(XTDiscoverSystemOnly), Texts({"com.example.x 1", "com.example.y 1"}));
  for (const Value& form : daemon_.connect().match({{XTIdentifierAttribute, "com.example.x"}})) {
    EXPECT_TRUE(form["systemResident"] == Value(true)) << form.describe();
  }
}

TEST_F(DiscoveryTest, OverriderAndOverriddenNameEachOther) {
  auto p = samplePlugIn("com.example.p");
  p.entitlements = Dictionary{{XTOverrideEntitlement, "com.example.q"}};
  write(daemon_.applications(), "a", {p, samplePlugIn("com.example.q"), samplePlugIn("com.example.r")});
  daemon_.start();
  std::map<std::string, Value> forms;
  for (const Value& form : daemon_.connect().match({})) forms[form["identifier"].string()] = form;
  ASSERT_EQ(forms.size(), 3U);
  EXPECT_EQ(forms["com.example.q"]["overrider"].string(), forms["com.example.p"]["uuid"].string());
  EXPECT_EQ(forms["com.example.p"]["overriding"].string(), "com.example.q");
  for (const char* key : {"overrider", "overriding"}) EXPECT_TRUE(forms["com.example.r"][key].isNothing());
  EXPECT_TRUE(daemon_.waitForLog("INFO ops: plug-in " + forms["com.example.p"]["uuid"].string() + " overrides " +
                                 forms["com.example.q"]["uuid"].string() + "\n"));
}

TEST_F(DiscoveryTest, AHostInAnApplicationIsOfferedItsOwnPlugIns) {
  auto dedicated = samplePlugIn("com.example.dedicated");
  tests::setPlugInKey(dedicated, "Dedicated", true);
  const auto host = daemon_.writeHost("host", {}, {dedicated, versioned("com.example.x", "1")});
  write(daemon_.applications(), "other", {versioned("com.example.x", "2")});
  write(daemon_.systemApplications(), "system", {versioned("com.example.x", "1")});
  daemon_.start();
  const std::string own = std::filesystem::path(host).parent_path() / "PlugIns";
  EXPECT_EQ(tests::Host(daemon_, host).offered(), Texts({"com.example.dedicated 1.0", "com.example.x 1"}));
  EXPECT_EQ(daemon_.countInLog(" in favor of bundle-relative '" + own + "/x.appex'\n"), 2U);
  EXPECT_EQ(match(), Texts{"com.example.x 2"}) << "a host elsewhere";
}

TEST_F(DiscoveryTest, AManagerMayLookAtEverythingThatIsNotExcluded) {
  auto dedicated = samplePlugIn("com.example.dedicated");
  tests::setPlugInKey(dedicated, "Dedicated", true);
  auto secret = samplePlugIn("com.example.secret");
  tests::setPlugInKey(secret, std::string(XTHostEntitlementInfoKey), "com.example.key");
  write(daemon_.applications(), "a", {dedicated, secret, samplePlugIn("com.example.plain")});
  setExclusions(Array{Dictionary{{XTIdentifierAttribute, "com.example.plain"}}, "no rules"});
  const auto stranger = daemon_.root() / "bin" / "stranger";
  const auto manager = daemon_.root() / "bin" / "manager";
  for (const auto& host : {stranger, manager}) {
    std::filesystem::create_directories(host.parent_path());
    std::filesystem::copy_file(tests::Daemon::hostProgram(), host);
  }
  tests::writePropertyList(manager.string() + ".entitlements", Dictionary{{XTManagerEntitlement, true}});
  daemon_.start();
  EXPECT_EQ(
      tests::failureOf(tests::Host(daemon_, stranger).request("match", {{"flags", std::uint64_t{XTDiscoverAll}}})),
      "11 unauthorized discovery flag (XTDiscoverAll)");
  tests::Host managing(daemon_, manager);
  EXPECT_EQ(managing.offered(), Texts());
  EXPECT_EQ(managing.offered({}, XTDiscoverAll), Texts({"com.example.dedicated 1.0", "com.example.secret 1.0"}));

  setExclusions("no list");
  EXPECT_EQ(match(), Texts{"com.example.plain 1.0"}) << "exclusions are read afresh";
}

}  // namespace
}  // namespace extora
