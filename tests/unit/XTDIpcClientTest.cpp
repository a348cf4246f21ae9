#include "xtd/XTDIpcClient.h"

#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <sys/wait.h>

#include <future>

#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"
#include "tests/support/TestServer.h"

namespace extora {
namespace {

using Lines = std::vector<std::string>;
using platform::IpcError;
using platform::IpcMessage;
using tests::FakeConnection;
using tests::sampleRecord;

const Dictionary kFind = {{"request", "find"}, {"version", std::uint64_t{3}}};
const std::string kPid = std::to_string(getpid());

class XTDIpcClientTest : public ::testing::Test {
 protected:
  tests::TestServer test_;
  std::shared_ptr<FakeConnection> connection_ = std::make_shared<FakeConnection>();
  std::shared_ptr<XTDIpcClient> client_ = test_.connect(connection_);
};

TEST_F(XTDIpcClientTest, KnowsItsPeer) {
  const auto executable = std::filesystem::read_symlink("/proc/self/exe").string();
  EXPECT_EQ(client_->pid(), getpid());
  EXPECT_EQ(client_->path(), executable);
  ASSERT_NE(client_->bundle(), nullptr);
  EXPECT_TRUE(client_->describe().ends_with(" con=fake pid=" + kPid + " path=" + executable + ">"));
  connection_.reset();
  EXPECT_EQ(client_->pid(), 0);
  EXPECT_TRUE(client_->describe().ends_with(" NO CONNECTION>"));
}

TEST_F(XTDIpcClientTest, APeerThatHasExitedIsRefused) {
  const pid_t child = fork();
  if (child == 0) _exit(0);
  const platform::UniqueFd pidfd(static_cast<int>(::syscall(SYS_pidfd_open, child, 0)));
  siginfo_t info;
  waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT);
  const auto connection = std::make_shared<FakeConnection>(platform::PeerIdentity::ofPidfd(pidfd.get()));
  tests::LogCapture log;
  EXPECT_EQ(test_.connect(connection), nullptr);
  const auto lines = log.take();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_TRUE(lines[0].starts_with("ERROR ops: Failed to get the file system path for the process with pid "));
  waitpid(child, nullptr, 0);
}

TEST_F(XTDIpcClientTest, TheConnectionOwnsTheClient) {
  const std::weak_ptr<XTDIpcClient> weak = client_;
  client_.reset();
  EXPECT_FALSE(weak.expired());
  connection_->end();
  EXPECT_TRUE(weak.expired());
}

TEST_F(XTDIpcClientTest, AnEntitlementIsGrantedByAnyValueButFalseAndZero) {
  test_.rights->entitlements = {{"no", "NO"}, {"true", true}, {"list", platform::Array()}, {"one", 1}, {"false", false},
                                {"zero", 0},  {"real", 0.0},  {"large", ~std::uint64_t{}}};
  for (const char* name : {"no", "true", "list", "one", "large"}) EXPECT_TRUE(client_->hasEntitlement(name)) << name;
  for (const char* name : {"false", "zero", "real", "absent"}) EXPECT_FALSE(client_->hasEntitlement(name)) << name;

  test_.rights->lookUpFails = true;
  tests::LogCapture log;
  EXPECT_FALSE(client_->hasEntitlement("true"));
  EXPECT_EQ(log.take(), Lines{"ERROR ops: error retrieving entitlements for client " + kPid});

  test_.rights->lookUpFails = false;
  test_.rights->hasTasks = false;
  EXPECT_FALSE(test_.connect(std::make_shared<FakeConnection>())->hasEntitlement("true"));
}

TEST_F(XTDIpcClientTest, EveryThousandthRequestGivesALine) {
  tests::LogCapture log("debug");
  for (int i = 0; i < 1999; ++i) connection_->deliver(IpcMessage{1, true, kFind});
  test_.drain();
  auto lines = log.take();
  std::erase_if(lines, [](const auto& line) { return line.find("so far") == std::string::npos; });
  EXPECT_EQ(lines, Lines{"DEBUG ops: client " + kPid + " used 1000 requests so far"});
  EXPECT_EQ(client_->requestCount(), 1999U);
  EXPECT_EQ(connection_->replies.size(), 1999U);
}

TEST_F(XTDIpcClientTest, OnlyItsDeathReleasesItsHolds) {
  const auto plugIn = test_.install(sampleRecord("com.a"));
  const auto first = std::make_shared<XTDPlugInHold>(std::vector{plugIn}, client_);
  const auto second = std::make_shared<XTDPlugInHold>(std::vector{plugIn}, client_);
  test_.server->addHold(first);
  test_.server->addHold(second);
  test_.platform.notifications->posted.clear();

  tests::LogCapture log("debug");
  connection_->deliver(IpcError{IpcError::Kind::TerminationImminent, "soon"});
  EXPECT_EQ(log.take(), Lines{"DEBUG ops: client " + kPid + " termination imminent"});
  EXPECT_TRUE(test_.server->holdOnPlugIn(*plugIn));
  EXPECT_TRUE(client_->acceptWork());

  connection_->end();
  const auto released = [](const auto& hold) {
    return "DEBUG ops: releasing plug-in hold " + hold->uuid().text() + " for dead client pid " + kPid;
  };
  EXPECT_EQ(log.take(), Lines({released(first), released(second), "DEBUG ops: client " + kPid + " is dead"}));
  EXPECT_EQ(test_.platform.notifications->posted.size(), 2U);
  EXPECT_FALSE(test_.server->holdOnPlugIn(*plugIn));
}

TEST_F(XTDIpcClientTest, WhatADeadClientLeftBehindIsDroppedUnlessItsVersionIsWrong) {
  // The service queue is kept busy until the client has died.
  std::promise<void> dead;
  test_.server->submitWork([future = std::make_shared<std::future<void>>(dead.get_future())] { future->wait(); },
                           false);
  connection_->deliver(IpcMessage{1, true, kFind});
  connection_->deliver(IpcMessage{2, true, Dictionary{{"request", "find"}}});
  connection_->end();
  dead.set_value();
  test_.drain();
  ASSERT_EQ(connection_->replies.size(), 1U);
  EXPECT_EQ(connection_->replies[0].id, 2U);
  EXPECT_EQ(connection_->replies[0].body["errorcode"].exactUnsigned(), 7U);
}

}  // namespace
}  // namespace extora
