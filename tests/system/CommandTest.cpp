// xtctl as a person runs it, against a running daemon: what it prints, what it complains about, how it ends.
#include <gtest/gtest.h>

#include "Extora/XTVocabulary.h"
#include "tests/support/Daemon.h"
#include "tests/support/Eventually.h"
#include "tests/support/SampleBundles.h"

namespace extora {
namespace {

using tests::RunningProgram;
using tests::sampleApplication;
using tests::samplePlugIn;

class CommandTest : public ::testing::Test {
 protected:
  /// Both of its outputs are collected.
  RunningProgram start(std::vector<std::string> arguments) const {
    arguments.insert(arguments.begin(), {"/bin/sh", "-c", "exec \"$0\" \"$@\" 2>&1", XTCTL_BINARY});
    return {
        arguments, {{"EXTORA_RUNTIME_DIR", daemon_.runtime()}, {"EXTORA_CONFIG_DIR", daemon_.config()}}, STDOUT_FILENO};
  }
  /// Its exit status, a colon, and what it wrote.
  std::string run(const std::vector<std::string>& arguments) const {
    RunningProgram program = start(arguments);
    const int status = program.wait();
    return std::to_string(status) + ":" + program.output();
  }

  tests::Daemon daemon_;
};

TEST_F(CommandTest, ElectionsAndNotesAreKeptAndShown) {
  tests::writeBundle(daemon_.applications(), sampleApplication("com.example.a", {samplePlugIn("com.example.x")}));
  daemon_.start();
  const std::string path = daemon_.applications() / "a.app/PlugIns/x.appex";
  EXPECT_EQ(run({"elections"}), "0:There are no elections.\n");
  EXPECT_EQ(run({"elect", "com.example.x", "ignore"}), "0:com.example.x 1.0: ignore (was none)\n");
  EXPECT_EQ(run({"elect", path, "-7"}), "0:com.example.x 1.0: -7 (was ignore)\n");
  EXPECT_NE(run({"elections"}).find("\n-7        com.example.x  1.0      "), std::string::npos) << run({"elections"});
  const auto noted = [&](const std::vector<std::string>& arguments) {
    std::vector<std::string> all = {"annotate", "com.example.x"};
    all.insert(all.end(), arguments.begin(), arguments.end());
    const std::string said = run(all);
    return said.substr(0, 2) + said.substr(said.find('\n') + 1);
  };
  EXPECT_EQ(noted({"--set", "a=1", "--set", "b=two words"}),
            "0:  election = -7\n  extension: a = 1\n  extension: b = two words\n");
  EXPECT_EQ(noted({"--delete", "a"}), "0:  election = -7\n  extension: b = two words\n");
  EXPECT_EQ(noted({}), "0:  election = -7\n  extension: b = two words\n");
  EXPECT_EQ(run({"elect", "com.example.x", "clear"}), "0:com.example.x 1.0: none (was -7)\n");
  EXPECT_EQ(noted({"--clear"}), "0:  election = 0\n");

  EXPECT_EQ(run({"elect", "com.example.y", "use"}),
            "1:xtctl: no plug-in with the identifier com.example.y is offered here; name it by UUID or path\n");
  EXPECT_TRUE(run({"elect", "com.example.x", "often"}).starts_with("2:xtctl: election: \"often\" is no election"));
  EXPECT_TRUE(run({"annotate", "com.example.x", "--file", "/none"}).starts_with("2:xtctl: /none: "));
}

TEST_F(CommandTest, WatchTellsEachChangeInOrderAndOutlivesTheDaemon) {
  daemon_.start();
  auto watch = start({"watch", "--json"});
  ASSERT_TRUE(watch.waitForOutput("xtctl: 0 plug-ins are offered; watching\n"));
  const auto a = sampleApplication("com.example.a", {samplePlugIn("com.example.x")});
  tests::installBundle(daemon_.applications(), a);
  ASSERT_TRUE(watch.waitForOutput("\"change\": \"installed\", \"identifier\": \"com.example.x\""));
  EXPECT_TRUE(tests::eventually([&] { return daemon_.notificationCount("com.orvane.registry-change") == 1; }));
  auto client = daemon_.connect();
  ASSERT_EQ(run({"elect", "com.example.x", "use"}).substr(0, 2), "0:");
  ASSERT_TRUE(
      watch.waitForOutput("\"change\": \"changed\", \"identifier\": \"com.example.x\", \"keys\": [\"annotations\"]"));
  const auto hold = client.request("lock", {{"paths", platform::Array{(daemon_.applications() / "a.app").string()}}});
  ASSERT_TRUE(watch.waitForOutput("\"change\": \"withdrawn\""));
  (void)client.request("lock", {{"uuids", platform::Array{hold["uuids"]}}});
  ASSERT_TRUE(watch.waitForOutput("\"change\": \"offered\""));
  daemon_.process().signal(SIGKILL);
  daemon_.process().wait();
  ASSERT_TRUE(watch.waitForOutput("xtctl: the daemon has gone; waiting for it\n"));
  daemon_.start();
  ASSERT_TRUE(watch.waitForOutput("xtctl: the daemon is back\n"));
  tests::removeBundle(daemon_.applications() / "a.app");
  ASSERT_TRUE(watch.waitForOutput("\"change\": \"removed\""));
  watch.signal(SIGINT);
  EXPECT_EQ(watch.wait(), 0);
  EXPECT_EQ(tests::countOf(watch.output(), "\"time\": "), 5U) << watch.output();
}

TEST_F(CommandTest, AHoldLastsAsLongAsItsCommandItsTokenOrItself) {
  const auto a =
      tests::writeBundle(daemon_.applications(), sampleApplication("com.example.a", {samplePlugIn("com.example.x")}));
  daemon_.start();
  auto client = daemon_.connect();
  const std::string match = XTCTL_BINARY + std::string(" match");
  const auto held = run({"hold", a, "--", "/bin/sh", "-c", match + "; exit 7"});
  EXPECT_TRUE(held.starts_with("7:hold ") && held.ends_with("\nNo plug-ins are offered.\n")) << held;
  EXPECT_EQ(run({"hold", a, "--", "/none"}).substr(0, 4), "127:");
  EXPECT_EQ(run({"hold", a + "/none"}), "1:xtctl: the daemon refused: invalid path: " + a + "/none (code 9)\n");
  EXPECT_TRUE(run({"hold", "--", "true"}).starts_with("2:xtctl: path is required\n"));
  EXPECT_TRUE(run({"release", "x"}).starts_with("2:xtctl: token: \"x\" is no token\n"));
  EXPECT_EQ(client.offered().size(), 1U);

  auto waiting = start({"hold", a + "/PlugIns/x.appex", "--plug-ins"});
  ASSERT_TRUE(waiting.waitForOutput("\n"));
  EXPECT_EQ(client.offered().size(), 0U);
  EXPECT_TRUE(run({"release", waiting.output().substr(5, 36)}).starts_with("0:no hold "));
  EXPECT_EQ(client.offered().size(), 1U);
  waiting.signal(SIGTERM);
  EXPECT_EQ(waiting.wait(), 0);

  auto stopped = start({"hold", a, "--", "/bin/sleep", "1000"});
  ASSERT_TRUE(stopped.waitForOutput("\n"));
  stopped.signal(SIGTERM);
  EXPECT_EQ(stopped.wait(), 128 + SIGTERM) << "the command's";
  EXPECT_EQ(client.offered().size(), 1U);
}

TEST_F(CommandTest, PlugInsAreAddedByAnybodyAndRemovedByManagers) {
  const auto vendor = daemon_.root() / "vendor";
  std::filesystem::create_directory(vendor);
  const auto path = tests::writeBundle(vendor, sampleApplication("com.example.a", {samplePlugIn("com.example.x")})) +
                    "/PlugIns/x.appex";
  daemon_.start();
  EXPECT_EQ(run({"add", path}), "0:added " + path + "\n");
  EXPECT_EQ(daemon_.connect().offered().size(), 1U);
  const auto refused = run({"remove", path});
  EXPECT_TRUE(refused.starts_with("1:") && refused.find("run xtctl-manager") != std::string::npos) << refused;
  EXPECT_EQ(run({"add", path + ".none"}),
            "1:xtctl: the daemon refused: invalid plugin path: " + path + ".none (code 9)\n");
}

TEST_F(CommandTest, WhyNamesTheConditionThatMakesTheDifference) {
  auto dedicated = samplePlugIn("com.example.dedicated");
  tests::setPlugInKey(dedicated, "Dedicated", true);
  auto demanding = samplePlugIn("com.example.demanding");
  tests::setPlugInKey(demanding, std::string(XTHostEntitlementInfoKey), "com.example.key");
  const auto newer = samplePlugIn("com.example.x", {{XTVersionAttribute, "1.10"}});
  const auto a = tests::writeBundle(
      daemon_.applications(), sampleApplication("com.example.a", {dedicated, demanding, newer, samplePlugIn("c.y")}));
  const auto b = tests::writeBundle(
      daemon_.applications(),
      sampleApplication("com.example.b", {samplePlugIn("com.example.x", {{XTVersionAttribute, "1.9"}})}));
  daemon_.start();
  const auto why = [&](const std::string& plugIn, std::vector<std::string> rules = {}) {
    rules.insert(rules.begin(), {"why", plugIn});
    return run(rules);
  };
  EXPECT_EQ(why("com.example.x"), "0:com.example.x 1.10: offered\n");
  const std::string old = b + "/PlugIns/x.appex";
  EXPECT_EQ(why(old), "1:com.example.x 1.9: not offered\n  com.example.x 1.10 at " + a +
                          "/PlugIns/x.appex is offered instead: it is newer\n");
  EXPECT_EQ(why(old, {"-r", "HXExtensionVersion=<1.10"}), "0:com.example.x 1.9: offered\n");
  EXPECT_EQ(why("c.y", {"-r", "HXExtensionVersion=1.0", "-r", "HXUserElection=1"}),
            "1:c.y 1.0: not offered\n  the rule HXUserElection = 1 does not hold; its election is none\n");
  EXPECT_EQ(why(a + "/PlugIns/dedicated.appex"),
            "1:com.example.dedicated 1.0: not offered\n  it is dedicated: only hosts in " + a + " are offered it\n");
  EXPECT_EQ(why(a + "/PlugIns/demanding.appex"),
            "1:com.example.demanding 1.0: not offered\n  the host does not have the \"com.example.key\" entitlement\n");
  tests::writePropertyList(
      daemon_.config() / "preferences" / "com.orvane.extora.userprefs.plist",
      platform::Dictionary{
          {XTExclusionsPreferenceKey, platform::Array{platform::Dictionary{{XTIdentifierAttribute, "c.y"}}}}});
  EXPECT_EQ(why(a + "/PlugIns/y.appex"),
            "1:c.y 1.0: not offered\n  the user has excluded it: see `xtctl exclusions`\n");
  auto client = daemon_.connect();
  (void)client.request("lock", {{"paths", platform::Array{b}}});
  EXPECT_EQ(why(old), "1:com.example.x 1.9: not offered\n  the plug-in is on hold\n");
  EXPECT_EQ(tests::countOf(why(b + "/PlugIns"), "`xtctl lint` says what is wrong with a bundle"), 1U);
}

TEST_F(CommandTest, ExclusionsAreShownWithWhatIsWrongWithThem) {
  const auto exclusions = [&](const platform::Value& value) {
    tests::writePropertyList(daemon_.config() / "preferences" / "com.orvane.extora.userprefs.plist",
                             platform::Dictionary{{XTExclusionsPreferenceKey, value}});
  };
  std::filesystem::create_directories(daemon_.config() / "preferences");
  EXPECT_TRUE(run({"exclusions"}).starts_with("0:Nothing is excluded ("));
  exclusions(platform::Array{platform::Dictionary{{"a", "b"}}});
  EXPECT_EQ(run({"exclusions"}), "0:  1. a = b\n");
  exclusions(platform::Array{platform::Dictionary{{"a", "b"}, {"c", 7}}, "x", platform::Dictionary{}});
  const auto said = run({"exclusions"});
  EXPECT_TRUE(said.starts_with("1:  1. a = b\n     c = 7\n     ! excludes nothing: the rule c never holds")) << said;
  EXPECT_EQ(tests::countOf(said, "  2. x\n     ! not a dictionary of rules: ignored\n  3. {}\n"), 1U) << said;
  exclusions("text");
  EXPECT_EQ(tests::countOf(run({"exclusions"}), "\"exclusions\" is no list: nothing is excluded\n"), 1U);
}

}  // namespace
}  // namespace extora
