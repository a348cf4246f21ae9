// Holds and terminations on a running daemon: what a hold keeps from whom, how it ends, and who waits for a plug-in
// that does not end.
#include <gtest/gtest.h>
#include <signal.h>
#include <stdlib.h>

#include <atomic>

#include "Extora/XTHostServices.h"
#include "Extora/XTProtocol.h"
#include "Extora/XTVocabulary.h"
#include "platform/ipc/PeerIdentity.h"
#include "tests/support/Daemon.h"
#include "tests/support/Eventually.h"

namespace extora {
namespace {

namespace fs = std::filesystem;
using platform::Array;
using platform::Dictionary;
using platform::Value;
using tests::failureOf;
using tests::sampleApplication;
using tests::samplePlugIn;

using Texts = std::vector<std::string>;

constexpr uid_t kNobody = 65534;

class HoldTest : public ::testing::Test {
 protected:
  HoldTest() {
    auto probe = samplePlugIn("com.example.a");
    probe.program = PROBE_BINARY;
    probe.info.set("IPCService", Dictionary{{"EnvironmentVariables",
                                             Dictionary{{"EXTORA_RUNTIME_DIR", daemon_.runtime().string()}}}});
    mail_ = tests::writeBundle(daemon_.applications(),
                               sampleApplication("com.example.mail", {probe, samplePlugIn("com.example.b")}));
    clock_ = tests::writeBundle(daemon_.applications(),
                                sampleApplication("com.example.clock", {samplePlugIn("com.example.c")}));
  }
  static Dictionary lockRequest(const Value& paths, std::uint64_t flags) {
    return {{"request", "lock"}, {"version", std::uint64_t{3}}, {"paths", paths}, {"flags", flags}};
  }
  Value lock(tests::Client& client, const Value& paths, std::uint64_t flags = 0) {
    return client.send(lockRequest(paths, flags));
  }
  void release(tests::Client& client, const Value& tokens) {
    EXPECT_TRUE(client.request("lock", {{"uuids", tokens}, {"paths", "x"}}) == Value(Dictionary()));
  }
  Texts offered() { return daemon_.connect().offered(); }
  std::uint64_t announced() { return daemon_.notificationCount(std::string(XTNotifyAnnotationChange)); }

  tests::Daemon daemon_;
  std::string mail_;
  std::string clock_;
  const Texts all_{"com.example.a 1.0", "com.example.b 1.0", "com.example.c 1.0"};
  const Texts clocks_{"com.example.c 1.0"};
};

TEST_F(HoldTest, AHoldBlocksAnApplicationOrPlugInsUntilItIsReleased) {
  daemon_.start();
  auto client = daemon_.connect();
  const auto a = client.match({{XTIdentifierAttribute, "com.example.a"}})[0];
  const std::string pathOfA = mail_ + "/PlugIns/a.appex";
  auto before = announced();
  for (const auto& [paths, flags, failure] : {
           std::tuple<Value, std::uint64_t, std::string>{Value(), 0, "4 invalid request format"},
           {Array{mail_, 7}, 0, "4 invalid request format"},
           {Array{"mail.app"}, 0, "9 absolute path required: mail.app"},
           {Array{mail_, mail_ + ".none"}, 0, "9 invalid path: " + mail_ + ".none"},
           {Array{pathOfA, mail_}, 1, "9 no plug-in at path:" + mail_},
       }) {
    EXPECT_EQ(failureOf(lock(client, paths, flags)), failure);
  }
  EXPECT_EQ(announced(), before);
  EXPECT_EQ(offered(), all_);

  const Value whole = lock(client, Array{mail_, daemon_.applications().string()}, 0x100);
  ASSERT_TRUE(whole["uuids"].isUuid()) << whole.describe();
  EXPECT_EQ(whole.size(), 1U);
  EXPECT_EQ(announced(), before + 1);
  EXPECT_EQ(offered(), clocks_);
  EXPECT_EQ(failureOf(client.request("ready", {{"uuids", Array{*platform::Uuid::parse(a["uuid"].string())}}})),
            "11 access to plugin com.example.a denied: the plug-in is on hold");
  const Value found = client.request("find", {{"uuids", *platform::Uuid::parse(a["uuid"].string())}});
  EXPECT_TRUE(found["matches"].isMessage()) << "who asks for it by name is told of it";
  auto other = daemon_.connect();
  const Value one = lock(other, Array{pathOfA, pathOfA}, XTHoldFlagPlugInPaths | XTHoldFlagRefuseBusy);
  const Value nothing = lock(client, Array{}, XTHoldFlagTerminate);
  ASSERT_TRUE(one["uuids"].isUuid() && nothing["uuids"].isUuid());
  EXPECT_EQ(announced(), before + 3);

  before = announced();
  release(other, Array{whole["uuids"], "no token", platform::Uuid::random()});
  EXPECT_EQ(offered(), (Texts{"com.example.b 1.0", "com.example.c 1.0"})) << "the other hold blocks it still";
  release(client, Array{whole["uuids"]});
  EXPECT_EQ(announced(), before + 1) << "once for two releases of the same";
  release(client, Array{one["uuids"]});
  EXPECT_EQ(offered(), all_);
  EXPECT_EQ(announced(), before + 2);

  ASSERT_TRUE(lock(client, Array{clock_})["uuids"].isUuid());
  before = announced();
  EXPECT_EQ(daemon_.stop(), 0);
  EXPECT_EQ(announced(), before + 1);
  EXPECT_EQ(daemon_.countInLog(" because server is stopping\n"), 2U) << "that of nothing, and that of the clock";
}

// A host that asks for holds without end is killed at any moment, also while one of its requests is being served.
TEST_F(HoldTest, NoHoldOutlivesItsClient) {
  const auto host = daemon_.writeHost("host");
  daemon_.start();
  auto bystander = daemon_.connect();
  const Value kept = lock(bystander, Array{clock_});
  const auto before = announced();
  const auto granted = [&] { return daemon_.countInLog("INFO ops: hold request granted uuid:"); };
  const auto released = [&] { return daemon_.countInLog(" for dead client pid "); };
  for (int round = 0; round < 20; ++round) {
    std::atomic<int> answered = 0;
    {
      tests::Host client(daemon_, host);
      EXPECT_EQ(failureOf(client.request("find", {{"sync", true}})), "15 Cannot locate PlugIn");
      for (int i = 0; i < 30; ++i) {
        client.connection().sendWithReply(lockRequest(Array{mail_}, XTHoldFlagTerminate * (i % 2)), client.queue(),
                                          [&](const auto&) { ++answered; });
      }
      EXPECT_TRUE(tests::eventually([&] { return answered >= round; }));
      ::kill(client.pid(), SIGKILL);
      EXPECT_TRUE(tests::eventually([&] { return answered == 30; }));
    }
    ASSERT_TRUE(daemon_.waitForLog(" is dead\n", static_cast<std::size_t>(round) + 1));
    ASSERT_TRUE(tests::eventually([&] { return offered() == Texts{"com.example.a 1.0", "com.example.b 1.0"}; }));
  }
  // All requests of the dead have been served by now.
  EXPECT_EQ(failureOf(bystander.request("find", {{"sync", true}})), "15 Cannot locate PlugIn");
  EXPECT_GE(granted(), 20U);
  EXPECT_EQ(released(), tests::countOf(daemon_.log(), "processing hold request") - 1) << "all but the bystander's";
  EXPECT_EQ(announced(), before + 2 * released()) << "each when it came and when it went";
  release(bystander, Array{kept["uuids"]});
  EXPECT_EQ(offered(), all_);
}

class TerminationTest : public HoldTest {
 protected:
  TerminationTest() {
    fs::permissions(daemon_.root(), fs::perms(0755));  // whoever plug-ins run as must reach their own
    daemon_.setEnvironment("EXTORA_PROFILES", PROFILES);
    daemon_.setEnvironment("EXTORA_PLUGIN_USER", std::to_string(::geteuid() == 0 ? kNobody : ::geteuid()));
    daemon_.setEnvironment("EXTORA_TERMINATION_GRACE_MS", "3600000");
    ::setenv("EXTORA_RUNTIME_DIR", daemon_.runtime().c_str(), 1);
  }

  // A running instance of com.example.a, of which this process is the host.
  struct Instance {
    explicit Instance(XTHostServices::Launched launched) : pid(launched.pid), client(std::move(launched.connection)) {}
    std::int64_t ask(const char* what) { return client.send({{"ask", what}})["errno"].integerValue(); }
    const pid_t pid;
    tests::Client client;
  };
  std::unique_ptr<Instance> launch() {
    auto client = daemon_.connect();
    const auto form = client.match({{XTIdentifierAttribute, "com.example.a"}})[0];
    const Value uuid = *platform::Uuid::parse(form["uuid"].string());
    EXPECT_EQ(failureOf(client.request("ready", {{"uuids", Array{uuid}}})), "");
    Error error;
    auto launched = XTHostServices::launch(mail_ + "/PlugIns/a.appex/plugin", &error);
    EXPECT_TRUE(launched) << error.describe();
    return launched ? std::make_unique<Instance>(std::move(*launched)) : nullptr;
  }
  static bool hasEnded(pid_t pid) {
    return tests::eventually([&] { return ::kill(pid, 0) != 0; });
  }
};

TEST_F(TerminationTest, ABusyInstanceRefusesAHoldAndAnUninstallEndsIt) {
  daemon_.start();
  const auto instance = launch();
  ASSERT_TRUE(instance);
  auto client = daemon_.connect();
  ASSERT_EQ(instance->ask("begin"), 0);
  const Value refused = lock(client, Array{clock_, mail_}, XTHoldFlagRefuseBusy | XTHoldFlagTerminate);
  EXPECT_EQ(failureOf(refused), "14 plug-ins are busy");
  EXPECT_TRUE(refused["conflicts"] == Value(Array{Value(Dictionary{{"HBBundleIdentifier", "com.example.a"}})}))
      << refused.describe();
  EXPECT_EQ(refused.size(), 3U);
  tests::RunningProgram command({XTCTL_BINARY, "hold", mail_, "--refuse-busy"}, daemon_.environment(), STDOUT_FILENO);
  EXPECT_EQ(command.wait(), 1);
  EXPECT_EQ(command.output(), "BUSY\ncom.example.a\n");
  EXPECT_EQ(offered(), all_);
  EXPECT_EQ(instance->ask("end"), 0) << "it runs on";
  EXPECT_TRUE(lock(client, Array{mail_}, XTHoldFlagRefuseBusy)["uuids"].isUuid());

  tests::removeBundle(mail_);
  EXPECT_TRUE(daemon_.waitForLog("DEBUG ops: removal complete for (com.example.a at " + mail_));
  EXPECT_TRUE(hasEnded(instance->pid));
  EXPECT_EQ(offered(), clocks_);
}

TEST_F(TerminationTest, OnlyWhoAskedForItWaitsForAnInstanceThatDoesNotEnd) {
  daemon_.start();
  const auto stubborn = launch();
  const auto willing = launch();
  ASSERT_TRUE(stubborn && willing);
  ASSERT_EQ(stubborn->ask("ignore-term"), 0);
  auto client = daemon_.connect();
  tests::Recorder<Value> replies;
  client.connection().sendWithReply(lockRequest(Array{mail_}, XTHoldFlagTerminate), client.queue(),
                                    [&](const platform::IpcReplyObject& reply) { replies.add(reply.body); });
  EXPECT_TRUE(hasEnded(willing->pid));

  auto other = daemon_.connect();
  EXPECT_EQ(other.offered(), clocks_) << "the hold is in force";
  EXPECT_TRUE(lock(other, Array{clock_}, XTHoldFlagTerminate)["uuids"].isUuid()) << "another termination";
  const Value further = lock(client, Array{mail_});
  EXPECT_TRUE(further["uuids"].isUuid()) << "the waiting client itself";
  release(client, Array{further["uuids"]});
  tests::installBundle(daemon_.applications(), sampleApplication("com.example.new", {samplePlugIn("com.example.d")}));
  EXPECT_TRUE(tests::eventually([&] { return offered() == Texts{"com.example.d 1.0"}; }));
  tests::removeBundle(mail_);
  EXPECT_TRUE(daemon_.waitForLog("DEBUG ops: waiting for 2 termination replies\n", 2)) << "that of the uninstall too";
  EXPECT_EQ(replies.now().size(), 0U);
  EXPECT_EQ(daemon_.countInLog("forced termination complete; "), 1U) << "that of the clock";

  ::kill(stubborn->pid, SIGKILL);
  const auto reply = replies.waitFor(1);
  ASSERT_EQ(reply.size(), 1U);
  ASSERT_TRUE(reply[0]["uuids"].isUuid());
  EXPECT_EQ(daemon_.countInLog("INFO ops: forced termination complete; hold request granted uuid:" +
                               reply[0]["uuids"].uuid().text() + "\n"),
            1U);
  EXPECT_TRUE(daemon_.waitForLog("DEBUG ops: removal complete for "));
}

}  // namespace
}  // namespace extora
