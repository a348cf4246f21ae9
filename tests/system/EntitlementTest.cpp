// Who may use what: every entitlement that the daemon looks at, held and not held, by hosts and plug-ins that are the
// executables of real bundles.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <fstream>

#include "Extora/XTProtocol.h"
#include "Extora/XTVocabulary.h"
#include "tests/support/Daemon.h"

namespace extora {
namespace {

namespace fs = std::filesystem;
using platform::Array;
using platform::Dictionary;
using platform::Value;
using tests::failureOf;
using tests::Host;
using tests::sampleApplication;
using tests::SampleBundle;
using tests::samplePlugIn;

using Texts = std::vector<std::string>;

class EntitlementTest : public ::testing::Test {
 protected:
  void start(std::vector<SampleBundle> plugIns) {
    tests::writeBundle(daemon_.applications(), sampleApplication("com.example.app", std::move(plugIns)));
    daemon_.start();
  }
  std::string pathOf(const std::string& plugIn) { return daemon_.applications() / "app.app/PlugIns" / plugIn; }
  // A host with these entitlements.
  Host host(const Value& entitlements) {
    return Host(daemon_, daemon_.writeHost("host" + std::to_string(++hosts_), entitlements));
  }
  Value form(const std::string& identifier) {
    const auto forms = daemon_.connect().match({{XTIdentifierAttribute, identifier}});
    return forms.size() == 1 ? forms[0] : Value();
  }
  std::string elect(const std::string& identifier, int election) {
    const Array uuid{*platform::Uuid::parse(form(identifier)["uuid"].string())};
    return failureOf(
        daemon_.connect().request("annotate", {{"annotations", Dictionary{{"election", election}}}, {"uuids", uuid}}));
  }
  Value electionOf(const std::string& identifier) { return form(identifier)["annotations"]["election"]; }
  static std::string ready(Host& host, const Value& uuid, Dictionary entries = {}) {
    entries.set("uuids", Array{*platform::Uuid::parse(uuid.string())});
    return failureOf(host.request("ready", entries));
  }

  tests::Daemon daemon_;
  int hosts_ = 0;
};

TEST_F(EntitlementTest, OnlyAManagerRemoves) {
  start({samplePlugIn("com.example.a")});
  const Dictionary remove{{"paths", Array{pathOf("a.appex")}}};
  for (const Value& rights : {Value(), Value(Dictionary{{XTManagerEntitlement, false}}),
                              Value(Dictionary{{XTEnvironmentProvisionEntitlement, true}})}) {
    auto stranger = host(rights);
    EXPECT_EQ(failureOf(stranger.request("remove", remove)), "11 caller lacks entitlement for this operation");
    EXPECT_EQ(failureOf(stranger.request("remove", {{"paths", Array{"/missing"}}})),
              "11 caller lacks entitlement for this operation");
    EXPECT_TRUE(daemon_.waitForLog("DEFAULT -: refused request from pid=" + std::to_string(stranger.pid()) +
                                   " to remove plug-in at " + pathOf("a.appex") +
                                   " - client lacks required entitlement\n"));
  }
  auto manager = host(Dictionary{{XTManagerEntitlement, "yes"}});
  EXPECT_EQ(manager.offered(), Texts{"com.example.a 1.0"});
  EXPECT_EQ(failureOf(manager.request("remove", remove)), "");
  EXPECT_EQ(manager.offered(), Texts());
}

TEST_F(EntitlementTest, ASandboxedManagerDoesNotSeeEverything) {
  const std::vector<std::string> sandbox{"/usr/bin/unshare", "--user"};
  if (tests::RunningProgram({sandbox[0], sandbox[1], "/bin/true"}, {}, STDERR_FILENO).wait() != 0) {
    GTEST_SKIP() << "no user namespaces here";
  }
  start({});
  const auto manager = daemon_.writeHost("manager", Dictionary{{XTManagerEntitlement, true}});
  const Dictionary all{{"flags", std::uint64_t{XTDiscoverAll}}};
  EXPECT_EQ(failureOf(Host(daemon_, manager).request("match", all)), "");
  Host sandboxed(daemon_, manager, sandbox);
  EXPECT_EQ(failureOf(sandboxed.request("match", all)), "11 unauthorized discovery flag (XTDiscoverAll)");
  EXPECT_EQ(failureOf(sandboxed.request("remove", {{"paths", Array{"/missing"}}})), "9 no plugin at /missing")
      << "its entitlements count for the rest";
}

TEST_F(EntitlementTest, HostsUseWhatTheirRestrictionAndThePlugInsRequirementAllow) {
  auto demanding = samplePlugIn("com.example.a");
  tests::setPlugInKey(demanding, std::string(XTHostEntitlementInfoKey), "com.example.key");
  auto unusable = samplePlugIn("com.example.c");
  tests::setPlugInKey(unusable, std::string(XTHostEntitlementInfoKey), 7);
  start({demanding, samplePlugIn("com.example.b"), unusable});
  const auto restrictedTo = [](const Value& rules, const Value& key = true) {
    return Dictionary{{XTAllowedPlugInsEntitlement, rules}, {"com.example.key", key}};
  };
  const std::string unheld = "the host does not have the \"com.example.key\" entitlement";
  const std::string unmatched = "the host's plug-in entitlement does not allow this plug-in";
  const std::string invalid = "invalid host restriction entitlement";
  const struct {
    Value entitlements;
    std::string a, b;  // the reasons of refusal
  } cases[] = {
      {Value(), unheld, ""},
      {restrictedTo({}), "", ""},
      {restrictedTo({}, "text"), "", ""},
      {restrictedTo({}, Array()), "", ""},
      {restrictedTo({}, false), unheld, ""},
      {restrictedTo(Dictionary{{XTIdentifierAttribute, "com.example.a"}}), "", unmatched},
      {restrictedTo(Dictionary{{XTIdentifierAttribute, "com.example.a"}}, 0), unheld, unmatched},
      {restrictedTo(Dictionary{{XTIdentifierAttribute, ">com.example.a"}}), unmatched, ""},
      {restrictedTo("com.example.a"), invalid, invalid},
      {restrictedTo(Array{"com.example.a"}), invalid, invalid},
      {restrictedTo(false), invalid, invalid},
  };
  auto manager = host(Dictionary{{XTManagerEntitlement, true}});
  const auto uuidOf = [&](const std::string& identifier) {
    return manager.match({{XTIdentifierAttribute, identifier}}, XTDiscoverAll)[0]["uuid"];
  };
  const Value uuids[] = {uuidOf("com.example.a"), uuidOf("com.example.b")};
  for (const auto& each : cases) {
    SCOPED_TRACE(each.entitlements.describe());
    auto client = host(each.entitlements);
    const auto offered = client.offered();
    for (const bool second : {false, true}) {
      const std::string identifier = second ? "com.example.b" : "com.example.a";
      const std::string& reason = second ? each.b : each.a;
      const std::string uuid = uuids[second].string();
      EXPECT_EQ(std::count(offered.begin(), offered.end(), identifier + " 1.0"), reason.empty() ? 1 : 0);
      EXPECT_EQ(ready(client, uuids[second]),
                reason.empty() ? "" : "11 access to plugin " + identifier + " denied: " + reason);
      if (reason.empty()) continue;
      const std::string pid = std::to_string(client.pid());
      EXPECT_TRUE(daemon_.waitForLog("INFO ops: client " + pid + " cannot use plugin " + uuid + ": " + reason + "\n"));
      EXPECT_TRUE(daemon_.waitForLog("DEFAULT ops: denied access to " + pid + " for plugin " + identifier + "(" + uuid +
                                     "): " + reason + "\n"));
    }
  }
  auto holder = host(Dictionary{{"7", true}});
  EXPECT_EQ(ready(holder, uuidOf("com.example.c")),
            "11 access to plugin com.example.c denied: the host does not have the \"7\" entitlement")
      << "what is no name cannot be held";
}

TEST_F(EntitlementTest, OnlyAProviderOfEnvironmentsSendsOne) {
  start({samplePlugIn("com.example.a")});
  const Value uuid = form("com.example.a")["uuid"];
  const Dictionary environment{{"environment", Dictionary{{"K", "v"}}}};
  const std::string name(XTEnvironmentProvisionEntitlement);
  auto provider = host(Dictionary{{name, true}});
  EXPECT_EQ(ready(provider, uuid, environment), "");
  EXPECT_TRUE(
      daemon_.waitForLog("DEBUG ops: pid " + std::to_string(provider.pid()) + " provided 1 environment entries\n"));
  EXPECT_TRUE(daemon_.waitForLog(" K: \"v\","));
  for (const Value& rights : {Value(), Value(Dictionary{{name, false}})}) {
    auto stranger = host(rights);
    EXPECT_EQ(ready(stranger, uuid, environment),
              "11 Transmission of environment variables requires the " + name + " host entitlement");
    EXPECT_EQ(ready(stranger, uuid, {{"environment", "K=v"}}), "") << "no environment at all";
  }
}

TEST_F(EntitlementTest, APlugInIsElectedByItsOwnEntitlementWhereThatCounts) {
  const auto electing = [](const std::string& identifier, const Value& value) {
    auto plugIn = samplePlugIn(identifier);
    plugIn.entitlements = Dictionary{{XTAutoElectEntitlement, value}};
    return plugIn;
  };
  auto untrusted = electing("com.example.untrusted", true);
  tests::writeBundle(
      daemon_.applications(),
      sampleApplication("com.example.app", {electing("com.example.yes", true), electing("com.example.text", "x"),
                                            electing("com.example.no", false), electing("com.example.zero", 0),
                                            samplePlugIn("com.example.none"), untrusted}));
  fs::permissions(pathOf("untrusted.appex/Entitlements.plist"), fs::perms(0666));
  daemon_.start();
  auto client = daemon_.connect();
  const Texts all = client.offered();
  const auto elected = [&](const char* value) { return client.offered({{XTUserElectionAttribute, value}}); };
  EXPECT_EQ(elected("1"), Texts({"com.example.text 1.0", "com.example.yes 1.0"}));
  EXPECT_EQ(elected("0").size(), all.size() - 2);
  EXPECT_TRUE(form("com.example.yes")["annotations"] == Value(Dictionary{{"election", 1}}));
  EXPECT_TRUE(form("com.example.no")["annotations"] == Value(Dictionary()));

  // A host's own election stands, but for 0, which counts as none when the record is made again.
  for (const int election : {2, 0}) {
    EXPECT_EQ(elect("com.example.yes", election), "");
    EXPECT_TRUE(electionOf("com.example.yes") == Value(election));
    daemon_.stop();
    daemon_.start();
    EXPECT_TRUE(electionOf("com.example.yes") == Value(election == 0 ? 1 : election));
  }
}

TEST_F(EntitlementTest, AReplacementSharesTheAnnotationsOfWhatItReplaces) {
  const auto replacing = [](const std::string& identifier, const Value& replaced) {
    auto plugIn = samplePlugIn(identifier);
    plugIn.entitlements = Dictionary{{XTOverrideEntitlement, replaced}};
    return plugIn;
  };
  start({replacing("com.example.p", "com.example.q"), samplePlugIn("com.example.q"),
         replacing("com.example.r", Array{"com.example.q"})});
  EXPECT_EQ(elect("com.example.p", 5), "");
  EXPECT_TRUE(electionOf("com.example.q") == Value(5));
  EXPECT_TRUE(electionOf("com.example.r").isNothing()) << "a list names nobody's annotations";
  EXPECT_EQ(elect("com.example.q", 6), "");
  EXPECT_TRUE(electionOf("com.example.p") == Value(6));
}

// Exclusions and consents: a file that says nothing usable excludes nobody and grants nothing, and holds nobody up.
TEST_F(EntitlementTest, TheUsersFilesCountAsSoonAsTheyCanBeRead) {
  start({samplePlugIn("com.example.keyboard", {{"RequestsOpenAccess", true}}, "com.orvane.keyboard-service"),
         samplePlugIn("com.example.a")});
  const fs::path preferences = daemon_.config() / "preferences/com.orvane.extora.userprefs.plist";
  const fs::path consents = daemon_.state() / "consent.plist";
  const auto text = [](const std::string& content) {
    return [content](const fs::path& path) { std::ofstream(path) << content; };
  };
  const struct {
    const char* what;
    std::function<void(const fs::path&)> make;
    const char* reason;
  } cases[] = {{"missing", [](const fs::path&) {}, nullptr},
               {"a directory", [](const fs::path& path) { fs::create_directory(path); }, "POSIX 21"},
               {"a pipe", [](const fs::path& path) { ::mkfifo(path.c_str(), 0600); }, "POSIX 22"},
               {"malformed", text("<plist version=\"1.0\"><dict>"), "PropertyList 1"},
               {"a list", text("<plist version=\"1.0\"><array/></plist>"), "it is not a dictionary"}};
  auto client = daemon_.connect();
  const Array keyboard{*platform::Uuid::parse(form("com.example.keyboard")["uuid"].string())};
  std::size_t assigned = 0;
  const auto profileIs = [&](const std::string& profile) {
    EXPECT_EQ(failureOf(client.request("ready", {{"uuids", keyboard}})), "");
    ASSERT_TRUE(daemon_.waitForLog(" sandbox\n", ++assigned));
    const std::string log = daemon_.log();
    EXPECT_TRUE(std::string_view(log).substr(log.rfind("assigning plug-in ")).find(" to " + profile + " sandbox\n") !=
                std::string::npos);
  };
  for (const auto& each : cases) {
    SCOPED_TRACE(each.what);
    for (const auto& path : {preferences, consents}) each.make(path);
    EXPECT_EQ(client.offered().size(), 2U);
    profileIs("keyboard");
    for (const auto& path : {preferences, consents}) {
      EXPECT_TRUE(each.reason == nullptr ||
                  daemon_.waitForLog("ERROR -: cannot use " + path.string() + ": " + each.reason));
      fs::remove_all(path);
    }
  }
  tests::writePropertyList(preferences, Dictionary{{XTExclusionsPreferenceKey,
                                                    Array{Dictionary{{XTIdentifierAttribute, "com.example.a"}}}}});
  EXPECT_EQ(client.offered(), Texts{"com.example.keyboard 1.0"});
  for (const bool granted : {false, true}) {
    const Value flag = granted ? Value(true) : Value(1);
    const Dictionary services{{"com.orvane.consent.keyboard-network", flag}};
    tests::writePropertyList(consents, Dictionary{{"com.example.app", services}});
    profileIs(granted ? "plugin" : "keyboard");
  }
}

}  // namespace
}  // namespace extora
