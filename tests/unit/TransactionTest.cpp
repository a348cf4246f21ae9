#include "xtd/Transaction.h"

#include <gtest/gtest.h>

#include "platform/ipc/IpcCodec.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"
#include "tests/support/TestServer.h"

namespace extora {
namespace {

using Lines = std::vector<std::string>;
using platform::Array;
using platform::IpcMessage;
using tests::sampleRecord;

constexpr std::uint64_t kVersion = 3;

struct Failure {
  std::uint64_t code = 0;
  std::string text;
  friend bool operator==(const Failure&, const Failure&) = default;
  friend std::ostream& operator<<(std::ostream& out, const Failure& f) { return out << f.code << " " << f.text; }
};

Failure failureOf(const Value& reply) {
  return {reply["errorcode"].exactUnsigned(), reply["error"].string()};
}

class TransactionTest : public ::testing::Test {
 protected:
  /// The reply to a request that is served as any other.
  Value serve(Dictionary request) {
    if (!request.contains("version")) request.set("version", kVersion);
    return test_.serve(*connection_, request);
  }
  /// A transaction of which a test calls the steps.
  std::shared_ptr<Transaction> transaction(Dictionary request) {
    connection_->replies.clear();
    return Transaction::initWithRequest(IpcMessage{7, true, std::move(request)}, client_);
  }
  Failure sentFailure() {
    EXPECT_EQ(connection_->replies.size(), 1U);
    return connection_->replies.empty() ? Failure() : failureOf(connection_->replies[0].body);
  }

  tests::TestServer test_;
  std::shared_ptr<tests::FakeConnection> connection_ = std::make_shared<tests::FakeConnection>();
  std::shared_ptr<XTDIpcClient> client_ = test_.connect(connection_);
};

TEST_F(TransactionTest, PlugInsAreFoundByUuidElseByPath) {
  const auto a = test_.install(sampleRecord("com.a"));
  const auto b = test_.install(sampleRecord("com.b"));
  const Uuid unknown = Uuid::random();
  const Failure notFound{4, "no such plugin (uuid not found)"};
  const std::string failedToFind = "INFO traffic: Failed to find plugin by " + unknown.text();
  const std::string looking = "INFO traffic: Looking for plugin " + unknown.text() + " by path ";
  const struct {
    Value uuids;
    Value paths;
    Lines visited;
    Failure failure;
    Lines lines;
  } cases[] = {
      {Value(), Value(), {}, {4, "invalid request format (uuid)"}, {}},
      {a->uuid(), Value(), {}, {4, "invalid request format (uuid)"}, {}},
      {Array{}, Value(), {}, {}, {}},
      {Array{a->uuid(), b->uuid()}, Value(), {"com.a", "com.b"}, {}, {}},
      {Array{a->uuid(), a->uuid().text()}, Value(), {"com.a"}, {4, "invalid request (bad uuid array)"}, {}},
      {Array{a->uuid(), unknown}, Value(), {"com.a"}, notFound, {}},
      {Array{unknown}, "/x", {}, notFound, {"DEFAULT traffic: Paths present but not an array (ignoring values)"}},
      {Array{unknown, a->uuid()},
       Array{"/1", "/2", "/3"},
       {},
       notFound,
       {"DEFAULT traffic: Paths present but has different count than UUIDs (ignoring)"}},
      {Array{a->uuid(), unknown}, Array{"/x", b->path()}, {"com.a", "com.b"}, {}, {failedToFind, looking + b->path()}},
      {Array{unknown}, Array{std::uint64_t{1}}, {}, notFound, {failedToFind}},
      {Array{unknown}, Array{"/none"}, {}, notFound, {failedToFind, looking + "/none"}},
  };
  for (const auto& test : cases) {
    SCOPED_TRACE(test.uuids.describe() + " " + test.paths.describe());
    tests::LogCapture log("traffic=info,ops=fault");
    Lines visited;
    const auto subject = transaction({{"uuids", test.uuids}, {"paths", test.paths}});
    const bool all = subject->processUuidList([&](const auto& plugIn) {
      visited.push_back(plugIn->identifier());
      return true;
    });
    EXPECT_EQ(all, test.failure == Failure());
    EXPECT_EQ(visited, test.visited);
    EXPECT_EQ(log.take(), test.lines);
    EXPECT_EQ(connection_->replies.size(), all ? 0U : 1U) << "success is the caller's to send";
    if (all) subject->done();
    EXPECT_EQ(sentFailure(), test.failure);
  }
}

TEST_F(TransactionTest, AFailureKeepsWhatIsThereAndTakesTheSystemsOwnErrors) {
  auto subject = transaction({});
  subject->reply().set("conflicts", Array{"x"});
  subject->fail(14, "plug-ins are busy");
  EXPECT_EQ(connection_->replies[0].id, 7U);
  EXPECT_EQ(
      Value(connection_->replies[0].body),
      Value(Dictionary{{"conflicts", Array{"x"}}, {"error", "plug-ins are busy"}, {"errorcode", std::uint64_t{14}}}));

  subject = transaction({});
  subject->fail(4, makeError(12, "misconfigured"));
  EXPECT_EQ(sentFailure(), (Failure{12, "misconfigured"}));
  subject = transaction({});
  subject->fail(4, Error{"POSIX", 2, "no file"});
  EXPECT_EQ(sentFailure(), (Failure{4, "no file"}));
}

TEST_F(TransactionTest, ExactlyOneAnswerIsAContract) {
#ifdef NDEBUG
  tests::LogCapture log;
  auto subject = transaction({});
  subject->done();
  subject->done();
  EXPECT_EQ(log.take(), Lines{"FAULT ops: internal inconsistency: transaction answered twice"});
  EXPECT_EQ(connection_->replies.size(), 1U);
  transaction({});
  EXPECT_EQ(log.take(), Lines{"FAULT ops: internal inconsistency: transaction destroyed unanswered"});
  const auto abandoned = transaction({});
  connection_->end();
  EXPECT_EQ(log.take().size(), 0U);
#else
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(transaction({}), "transaction destroyed unanswered");
  const auto subject = transaction({});
  subject->done();
  EXPECT_DEATH(subject->done(), "transaction answered twice");
#endif
}

TEST_F(TransactionTest, FindIgnoresWhatHostsMayUseAndTheLocationDecides) {
  const auto a = test_.install(sampleRecord("com.a"));
  const auto b = test_.install(sampleRecord("com.b"));
  test_.server->setAnnotation(Dictionary{{"election", 1}}, *a);
  test_.server->addHold(std::make_shared<XTDPlugInHold>(std::vector{a}, client_));
  const Failure notFound{15, "Cannot locate PlugIn"};
  const auto find = [&](const Value& uuid, const Value& location, std::uint64_t version = 3) {
    return serve({{"request", "find"}, {"uuids", uuid}, {"paths", location}, {"version", version}});
  };
  const Value form = platform::fromWireMessage(find(a->uuid(), {})["matches"]);
  EXPECT_EQ(form["uuid"], a->uuid().text());
  EXPECT_EQ(form["annotations"], Value(Dictionary{{"election", 1}}));
  const Value byUrl = platform::fromWireMessage(find(a->uuid(), b->url().absoluteString())["matches"]);
  EXPECT_EQ(byUrl["uuid"], b->uuid().text());
  EXPECT_EQ(byUrl["annotations"], Value(Dictionary()));
  EXPECT_EQ(failureOf(find(a->uuid(), "file:///unknown")), notFound);
  EXPECT_EQ(failureOf(find(a->uuid(), b->path())), notFound) << "a bare path is no location";
  EXPECT_EQ(failureOf(find(a->uuid().text(), a->uuid())), notFound) << "each of the other's type";
  EXPECT_EQ(failureOf(find({}, {})), notFound);
  EXPECT_EQ(find(a->uuid(), {}, 2), Value(Dictionary())) << "version 2 has no encoding for forms";
}

}  // namespace
}  // namespace extora
