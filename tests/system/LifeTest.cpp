// What becomes of installed applications while the daemon runs: they come, go, are replaced, broken, registered and
// unregistered by request, one by one and by the thousand.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <stdio.h>

#include <fstream>

#include "Extora/XTVocabulary.h"
#include "tests/support/Daemon.h"
#include "tests/support/Eventually.h"

namespace extora {
namespace {

namespace fs = std::filesystem;
using platform::Array;
using platform::Dictionary;
using platform::Value;
using tests::failureOf;
using tests::installBundle;
using tests::sampleApplication;
using tests::SampleBundle;
using tests::samplePlugIn;
using tests::writeBundle;

using Texts = std::vector<std::string>;

class LifeTest : public ::testing::Test {
 protected:
  /// An application "com.example.<name>" of plug-ins "<plugIn>" of one version.
  static SampleBundle application(const std::string& name, const Texts& plugIns, const std::string& version = "1") {
    std::vector<SampleBundle> bundles;
    for (const auto& each : plugIns) bundles.push_back(samplePlugIn(each, {{XTVersionAttribute, version}}));
    return sampleApplication("com.example." + name, std::move(bundles));
  }
  [[nodiscard]] bool offers(const Texts& wanted) {
    Texts last;
    const auto asWanted = [&] { return (last = daemon_.connect().offered()) == wanted; };
    const bool seen = tests::eventually(asWanted);
    if (!seen) ADD_FAILURE() << "offered: " << ::testing::PrintToString(last);
    return seen;
  }
  std::string uuidOf(const std::string& identifier) {
    const auto forms = daemon_.connect().match({{XTIdentifierAttribute, identifier}});
    return forms.size() == 1 ? forms[0]["uuid"].string() : "none";
  }
  std::uint64_t changes() { return daemon_.notificationCount("com.orvane.registry-change"); }
  // How often the log has the line about an install or uninstall of that UUID, and where it is.
  std::size_t placeInLog(const std::string& what, const std::string& uuid) {
    EXPECT_TRUE(daemon_.waitForLog(uuid)) << uuid;
    const std::string log = daemon_.log();
    std::size_t line = log.find("DEFAULT ops: plug-in " + what + ":");
    while (line != std::string::npos && log.substr(line, log.find('\n', line) - line).find(uuid) == std::string::npos) {
      line = log.find("DEFAULT ops: plug-in " + what + ":", line + 1);
    }
    EXPECT_NE(line, std::string::npos) << what << " " << uuid;
    return line;
  }
  void restart() {
    EXPECT_EQ(daemon_.stop(), 0);
    daemon_.start();
  }

  tests::Daemon daemon_;
  const fs::path apps_ = daemon_.applications();
};

TEST_F(LifeTest, AnApplicationComesIsReplacedExchangedRenamedAndGoes) {
  daemon_.start();
  ASSERT_TRUE(offers({}));
  const fs::path mail = installBundle(apps_, application("mail", {"x"}));
  ASSERT_TRUE(offers({"x 1"}));
  const auto first = uuidOf("x");
  EXPECT_EQ(changes(), 1U);

  installBundle(apps_, application("mail", {"x"}, "2"));
  ASSERT_TRUE(offers({"x 2"}));
  const auto second = uuidOf("x");
  EXPECT_NE(second, first);
  EXPECT_LT(placeInLog("UNINSTALLED", first), placeInLog("INSTALLED", second));
  EXPECT_EQ(failureOf(daemon_.connect().request("find", {{"uuids", *platform::Uuid::parse(first)}})),
            "15 Cannot locate PlugIn");

  // What was looked at just now is exchanged in one step: each is another plug-in at its new place.
  const fs::path clock = installBundle(apps_, application("clock", {"y"}));
  ASSERT_TRUE(offers({"x 2", "y 1"}));
  const auto y = uuidOf("y");
  ASSERT_EQ(::renameat2(AT_FDCWD, mail.c_str(), AT_FDCWD, clock.c_str(), RENAME_EXCHANGE), 0);
  ASSERT_TRUE(daemon_.waitForLog("DEFAULT ops: plug-in INSTALLED:x x(1) ", 3));
  ASSERT_TRUE(offers({"x 2", "y 1"}));
  EXPECT_EQ(daemon_.connect().match({{XTIdentifierAttribute, "x"}})[0]["path"].string(), clock / "PlugIns" / "x.appex");
  const auto third = uuidOf("x");
  EXPECT_NE(third, second);
  for (const auto& left : {second, y}) {
    for (const auto& came : {third, uuidOf("y")}) {
      EXPECT_LT(placeInLog("UNINSTALLED", left), placeInLog("INSTALLED", came));
    }
  }

  fs::rename(mail, apps_ / "mail.away");
  ASSERT_TRUE(offers({"x 2"}));
  fs::rename(apps_ / "mail.away", apps_ / "post.app");
  ASSERT_TRUE(offers({"x 2", "y 1"}));
  fs::remove_all(clock);
  ASSERT_TRUE(offers({"y 1"}));
  fs::remove_all(apps_ / "post.app");
  ASSERT_TRUE(offers({}));
  EXPECT_EQ(tests::countOf(daemon_.log(), "INSTALLED:"), 12U) << "six came, six went";
}

TEST_F(LifeTest, WhatIsBrokenOrLinkedIsLeftOutWithALineUntilItIsRight) {
  const fs::path mail = writeBundle(apps_, application("mail", {"good", "bad"}));
  const fs::path info = mail / "PlugIns/bad.appex/Info.plist";
  std::ofstream(info) << "<plist>";
  fs::create_directory_symlink(apps_, mail / "PlugIns/cycle.appex");
  daemon_.start();
  ASSERT_TRUE(offers({"good 1"}));
  EXPECT_EQ(daemon_.countInLog("DEFAULT ar: left out " + info.parent_path().string() + ": Info.plist: "), 1U);
  EXPECT_EQ(daemon_.countInLog("DEFAULT ar: left out " + (mail / "PlugIns/cycle.appex: it is a link\n").string()), 1U);
  const auto good = uuidOf("good");
  tests::writePropertyList(info, samplePlugIn("bad").info);
  ASSERT_TRUE(offers({"bad 1.0", "good 1"}));
  EXPECT_EQ(uuidOf("good"), good);
  fs::create_directory_symlink(mail, apps_ / "linked.app");
  ASSERT_TRUE(daemon_.waitForLog("DEFAULT ar: left out " + (apps_ / "linked.app: it is a link\n").string()));
  ASSERT_TRUE(offers({"bad 1.0", "good 1"}));
}

TEST_F(LifeTest, AFolderMayComeLaterBeMovedAwayOrBeMadeAnew) {
  const fs::path top = daemon_.root() / "top";
  const fs::path folder = top / "middle" / "apps";
  daemon_.setEnvironment("EXTORA_APPLICATIONS", folder);
  daemon_.start();
  fs::create_directories(folder);
  writeBundle(folder, application("mail", {"filter"}));
  ASSERT_TRUE(offers({"filter 1"}));
  fs::rename(top, top.string() + ".away");
  ASSERT_TRUE(offers({}));
  fs::create_directories(folder);
  installBundle(folder, application("clock", {"hands"}));
  ASSERT_TRUE(offers({"hands 1"}));
  fs::rename(folder, folder.string() + ".away");
  fs::rename(top.string() + ".away/middle/apps", folder);
  ASSERT_TRUE(offers({"filter 1"}));
  fs::remove_all(folder);
  ASSERT_TRUE(offers({}));
  fs::create_directory(folder);
  installBundle(folder, application("clock", {"hands"}));
  ASSERT_TRUE(offers({"hands 1"}));
}

TEST_F(LifeTest, AThousandInstallsAreOneChangeAndLostEventsLoseNothing) {
  const fs::path waiting = apps_ / ".waiting";
  fs::create_directory(waiting);
  Texts all;
  for (int i = 1000; i < 2000; ++i) {
    const auto number = std::to_string(i);
    writeBundle(waiting, application("app" + number, {"plugin" + number}));
    all.push_back("plugin" + number + " 1");
  }
  daemon_.start();
  // While it is stopped nobody reads its events.
  daemon_.process().signal(SIGSTOP);
  for (const auto& each : fs::directory_iterator(waiting)) fs::rename(each, apps_ / each.path().filename());
  daemon_.process().signal(SIGCONT);
  ASSERT_TRUE(offers(all));
  EXPECT_LE(changes(), 2U);

  std::size_t limit = 0;
  std::ifstream("/proc/sys/fs/inotify/max_queued_events") >> limit;
  ASSERT_GT(limit, 0U);
  const auto before = changes();
  daemon_.process().signal(SIGSTOP);
  fs::create_directory(apps_ / "a");
  for (std::size_t i = 0; i <= limit / 4; ++i) {
    fs::rename(apps_ / "a", apps_ / "b");
    fs::rename(apps_ / "b", apps_ / "a");
  }
  installBundle(apps_, application("late", {"a"}));
  tests::removeBundle(apps_ / "app1000.app");
  installBundle(apps_, application("app1001", {"plugin1001"}, "2"));
  daemon_.process().signal(SIGCONT);
  all.erase(all.begin());
  all.front() = "plugin1001 2";
  all.insert(all.begin(), "a 1");
  ASSERT_TRUE(offers(all));
  EXPECT_LE(changes(), before + 2);
}

TEST_F(LifeTest, WhatIsRegisteredOrUnregisteredByRequestStaysSo) {
  const fs::path vendor = daemon_.root() / "vendor";
  fs::create_directory(vendor);
  const fs::path tool = writeBundle(vendor, application("tool", {"t", "u"})) + "/PlugIns/t.appex";
  const fs::path x = writeBundle(apps_, application("mail", {"x", "y"})) + "/PlugIns/x.appex";
  const fs::path manager = daemon_.writeHost("manager", Dictionary{{XTManagerEntitlement, true}});
  daemon_.start();
  const auto add = [&](const Value& paths) { return failureOf(daemon_.connect().request("add", {{"paths", paths}})); };
  const auto remove = [&](const Value& paths) {
    return failureOf(tests::Host(daemon_, manager).request("remove", {{"paths", paths}}));
  };
  EXPECT_EQ(add(Array{tool.string(), vendor.string()}), "2 unable to register plug-in at " + vendor.string());
  EXPECT_EQ(daemon_.countInLog("DEFAULT ops: failed to register plug-in at " + vendor.string() + "\n"), 1U);
  EXPECT_EQ(daemon_.connect().offered(), Texts({"t 1", "x 1", "y 1"})) << "with the reply, and what came before it";
  EXPECT_EQ(add(Array{(vendor / "none").string()}), "9 invalid plugin path: " + (vendor / "none").string());
  EXPECT_EQ(add(Array{"relative"}), "9 absolute path required: relative");
  EXPECT_EQ(add(Array{}), "");
  EXPECT_EQ(remove(Array{x.string(), x.string(), tool.string()}), "9 no plugin at " + x.string());
  EXPECT_EQ(daemon_.connect().offered(), Texts({"t 1", "y 1"}));
  const auto t = uuidOf("t");
  restart();
  EXPECT_EQ(daemon_.connect().offered(), Texts({"t 1", "y 1"}));
  EXPECT_EQ(uuidOf("t"), t);
  fs::create_symlink(tool, vendor / "link");
  EXPECT_EQ(add(Array{(vendor / "link").string()}), "") << "what it resolves to";
  EXPECT_EQ(uuidOf("t"), t);

  installBundle(apps_, application("mail", {"x", "y"}, "2"));
  ASSERT_TRUE(offers({"t 1", "x 2", "y 2"}));
  EXPECT_EQ(remove(Array{tool.string()}), "");
  EXPECT_EQ(daemon_.connect().offered(), Texts({"x 2", "y 2"}));
  restart();
  EXPECT_EQ(daemon_.connect().offered(), Texts({"x 2", "y 2"}));
  EXPECT_EQ(failureOf(daemon_.connect().request("bulk", {{"flags", std::uint64_t{0x1f}}})), "");
  EXPECT_EQ(daemon_.countInLog("INFO ops: bulk options 0x1f not supported\n"), 1U);
}

}  // namespace
}  // namespace extora
