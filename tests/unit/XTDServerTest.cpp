#include "xtd/XTDServer.h"

#include <gtest/gtest.h>

#include "Extora/XTVocabulary.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"
#include "tests/support/TestServer.h"

namespace extora {
namespace {

using Lines = std::vector<std::string>;
using tests::FakeConnection;
using tests::sampleRecord;

class XTDServerTest : public ::testing::Test {
 protected:
  std::shared_ptr<XTDPlugInHold> hold(const std::vector<std::shared_ptr<XTDPlugIn>>& plugIns,
                                      const std::shared_ptr<XTDIpcClient>& client) {
    auto hold = std::make_shared<XTDPlugInHold>(plugIns, client);
    test_.server->addHold(hold);
    return hold;
  }
  std::size_t announced() { return std::exchange(test_.platform.notifications->posted, {}).size(); }

  tests::TestServer test_;
  XTDServer& server_ = *test_.server;
  std::shared_ptr<FakeConnection> connection_ = std::make_shared<FakeConnection>();
  std::shared_ptr<XTDIpcClient> client_ = test_.connect(connection_);
};

TEST_F(XTDServerTest, AServiceThatIsServedAlreadyCannotBeMade) {
  tests::LogCapture log;
  EXPECT_EQ(test_.make(), nullptr);
  const auto lines = log.take();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_TRUE(lines[0].starts_with("ERROR ops: unable to create service test: "));
  EXPECT_EQ(XTDServer::server(), test_.server) << "a server that could not be made is never the shared one";
}

TEST_F(XTDServerTest, APlugInIsHeldWhileAnyHoldBlocksIt) {
  const auto a = test_.install(sampleRecord("com.a"));
  const auto b = test_.install(sampleRecord("com.b"));
  const auto first = hold({a, a}, client_);
  const auto second = hold({a}, client_);
  EXPECT_EQ(first->blockedCount(), 1U);
  EXPECT_EQ(announced(), 2U);
  EXPECT_TRUE(server_.holdOnPlugIn(*a));
  EXPECT_FALSE(server_.holdOnPlugIn(*b));

  tests::LogCapture log("debug");
  server_.unholdToken(first->uuid());
  server_.unholdToken(first->uuid());
  EXPECT_EQ(log.take(), Lines{"DEBUG ops: releasing plug-in hold " + first->uuid().text() + " at client's request"});
  EXPECT_EQ(announced(), 1U);
  EXPECT_TRUE(server_.holdOnPlugIn(*a));
  server_.unholdToken(second->uuid());
  EXPECT_FALSE(server_.holdOnPlugIn(*a));
}

TEST_F(XTDServerTest, OnlyTheClientsOwnHoldsEndWithIt) {
  const auto a = test_.install(sampleRecord("com.a"));
  const auto other = std::make_shared<FakeConnection>();
  const auto kept = hold({a}, test_.connect(other));
  hold({a}, client_);
  server_.unholdClient(*client_);
  EXPECT_TRUE(server_.holdOnPlugIn(*a));
  server_.unholdToken(kept->uuid());
  EXPECT_FALSE(server_.holdOnPlugIn(*a));
}

TEST_F(XTDServerTest, AHoldThatComesAfterItsClientsDeathDoesNotStay) {
  const auto a = test_.install(sampleRecord("com.a"));
  connection_->end();
  hold({a}, client_);
  EXPECT_FALSE(server_.holdOnPlugIn(*a));
}

TEST_F(XTDServerTest, StopReleasesEveryHoldAndAnnouncesOnce) {
  const auto a = test_.install(sampleRecord("com.a"));
  const auto first = hold({a}, client_);
  const auto second = hold({}, client_);
  announced();
  tests::LogCapture log("debug");
  server_.stop();
  EXPECT_EQ(server_.holdOnPlugIn(*a), false);
  auto lines = log.take();
  std::erase_if(lines, [](const auto& line) { return line.find("releasing") == std::string::npos; });
  const auto line = [](const auto& hold) {
    return "DEBUG ops: releasing plug-in hold " + hold->uuid().text() + " because server is stopping";
  };
  EXPECT_EQ(lines, Lines({line(first), line(second)}));
  EXPECT_EQ(test_.platform.notifications->posted, Lines{std::string(XTNotifyAnnotationChange)});
}

TEST_F(XTDServerTest, SynchronousWorkRunsAfterAllThatWasSubmittedBefore) {
  std::vector<int> order;
  for (int i = 0; i < 100; ++i) server_.submitWork([&order, i] { order.push_back(i); }, false);
  tests::LogCapture log("debug");
  server_.submitWork([&order] { order.push_back(100); }, true);
  EXPECT_EQ(log.take(), Lines{"DEBUG ops: submitting block to main queue synchronously"});
  ASSERT_EQ(order.size(), 101U);
  EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

}  // namespace
}  // namespace extora
