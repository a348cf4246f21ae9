#include "xtd/Transaction.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>

#include "Extora/XTDaemonClient.h"
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
using tests::setPlugInDictionary;

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
  /// The identifiers of a "match", sorted.
  Lines match(const Value& rules = {}, std::uint64_t flags = 0) {
    const auto reply = serve({{"request", "match"}, {"rules", rules}, {"flags", flags}});
    EXPECT_TRUE(reply["matches"].isMessage()) << reply.describe();
    Lines identifiers;
    const Value forms = platform::fromWireMessage(reply["matches"]);
    for (const Value& form : forms.items()) identifiers.push_back(form["identifier"].string());
    std::sort(identifiers.begin(), identifiers.end());
    return identifiers;
  }

  tests::TestServer test_;
  std::shared_ptr<tests::FakeConnection> connection_ = std::make_shared<tests::FakeConnection>();
  std::shared_ptr<XTDIpcClient> client_ = test_.connect(connection_);
};

TEST_F(TransactionTest, VersionsTwoAndThreeAreServed) {
  const Failure served{15, "Cannot locate PlugIn"};
  for (const std::uint64_t version : {2, 3}) {
    EXPECT_EQ(failureOf(serve({{"request", "find"}, {"version", version}})), served);
  }
  for (const Value& version :
       {Value(std::uint64_t{1}), Value(std::uint64_t{4}), Value(3), Value(std::uint64_t{1} << 32), Value("3")}) {
    const auto shown = std::to_string(version.exactUnsigned());
    EXPECT_EQ(failureOf(serve({{"request", "find"}, {"version", version}})),
              (Failure{7, "unsupported protocol version " + shown + " (current 3)"}));
  }
  EXPECT_EQ(failureOf(test_.serve(*connection_, {})), (Failure{7, "unsupported protocol version 0 (current 3)"}));
}

TEST_F(TransactionTest, TypesAreComparedExactly) {
  const Failure missing{4, "invalid request format (missing type)"};
  EXPECT_EQ(failureOf(serve({})), missing);
  EXPECT_EQ(failureOf(serve({{"request", std::uint64_t{1}}})), missing);
  for (const char* type : {"Match", "match ", "", "finds"}) {
    EXPECT_EQ(failureOf(serve({{"request", type}})), (Failure{4, "unrecognized request"})) << type;
  }
}

TEST_F(TransactionTest, PathsAreVisitedUntilOneIsBad) {
  const auto file = test_.platform.directory.path("file");
  const auto link = test_.platform.directory.path("link");
  const auto none = test_.platform.directory.path("none");
  std::ofstream(file) << "x";
  std::filesystem::create_symlink("file", link);
  const struct {
    Value paths;
    Lines visited;
    Failure failure;
  } cases[] = {
      {Value(), {}, {4, "invalid request format"}},
      {"/x", {}, {4, "invalid request format"}},
      {Array{link, std::uint64_t{1}, none}, {"+" + file}, {4, "invalid request format"}},
      {Array{link, "relative/path"}, {"+" + file}, {9, "absolute path required: relative/path"}},
      {Array{none, none + "/../file", ""}, {"-" + none, "-" + none + "/../file"}, {9, "absolute path required: "}},
      {Array{link, none}, {"+" + file, "-" + none}, {}},
      {Array{}, {}, {}},
  };
  for (const auto& test : cases) {
    SCOPED_TRACE(test.paths.describe());
    Lines visited;
    const auto subject = transaction({{"paths", test.paths}});
    const bool all = subject->processPaths([&](const std::string& path, bool exists) {
      visited.push_back((exists ? "+" : "-") + path);
      return true;
    });
    EXPECT_EQ(all, test.failure == Failure());
    EXPECT_EQ(visited, test.visited);
    EXPECT_EQ(sentFailure(), test.failure);
  }
  const auto subject = transaction({{"paths", Array{"/a", "/b"}}});
  int visits = 0;
  EXPECT_FALSE(subject->marshalPaths([&](const auto&, bool) {
    ++visits;
    subject->fail(9, "stop");
    return false;
  }));
  EXPECT_EQ(visits, 1);
  EXPECT_EQ(sentFailure(), (Failure{9, "stop"}));
}

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

TEST_F(TransactionTest, MatchChecksItsArguments) {
  const Failure unauthorized{11, "unauthorized discovery flag (XTDiscoverAll)"};
  const auto request = [&](const Value& rules, const Value& flags) {
    return failureOf(serve({{"request", "match"}, {"rules", rules}, {"flags", flags}}));
  };
  EXPECT_EQ(request("x", std::uint64_t{0x200}), (Failure{4, "invalid request format (bad rules dictionary)"}));
  EXPECT_EQ(request({}, std::uint64_t{0x200}), unauthorized);
  test_.rights->entitlements = {{XTManagerEntitlement, true}};
  EXPECT_EQ(request({}, std::uint64_t{0x200}), Failure());
  test_.rights->sandboxed = true;
  EXPECT_EQ(request({}, std::uint64_t{0x200}), unauthorized);
  EXPECT_EQ(request({}, 0x200), Failure()) << "flags of another type are no flags";
}

TEST_F(TransactionTest, MatchOffersWhatTheHostMayUse) {
  const auto installed = sampleRecord("com.app");
  auto system = sampleRecord("com.system");
  system.onSystemPartition = true;
  auto outside = sampleRecord("com.outside");
  outside.bundleURL = Url::file("/System/PlugIns/outside.appex");
  auto dedicated = sampleRecord("com.dedicated");
  setPlugInDictionary(dedicated, {{XTDedicatedInfoKey, true}, {XTAttributesInfoKey, Dictionary()}});
  auto secret = sampleRecord("com.secret");
  setPlugInDictionary(secret, {{XTHostEntitlementInfoKey, "com.example.key"}, {XTAttributesInfoKey, Dictionary()}});
  for (const auto& record : {installed, system, dedicated, secret}) test_.install(record);
  test_.platform.registry->install(std::nullopt, {outside});
  const auto held = test_.install(sampleRecord("com.held"));
  const auto hold = std::make_shared<XTDPlugInHold>(std::vector{held}, client_);
  test_.server->addHold(hold);

  EXPECT_EQ(match(), Lines({"com.app", "com.system"}));
  EXPECT_EQ(match({}, XTDiscoverSystemOnly), Lines({"com.system"}));
  EXPECT_EQ(match(Dictionary{{XTIdentifierAttribute, "<>com.app"}}), Lines({"com.system"}));
  test_.rights->entitlements = {{"com.example.key", true}, {XTManagerEntitlement, true}};
  EXPECT_EQ(match(), Lines({"com.app", "com.secret", "com.system"}));
  test_.server->unholdToken(hold->uuid());
  EXPECT_EQ(match(), Lines({"com.app", "com.held", "com.secret", "com.system"}));

  const Lines all = {"com.app", "com.dedicated", "com.held", "com.outside", "com.secret", "com.system"};
  EXPECT_EQ(match({}, XTDiscoverAll), all);
  test_.preferences->values = {
      {XTExclusionsPreferenceKey, Array{7, Dictionary{{XTIdentifierAttribute, Array{"com.app", "com.held"}}}}}};
  tests::LogCapture log("ops=info");
  EXPECT_EQ(match({}, XTDiscoverAll), Lines({"com.dedicated", "com.outside", "com.secret", "com.system"}));
  const auto lines = log.take();
  EXPECT_EQ(
      std::count_if(lines.begin(), lines.end(), [](const auto& line) { return line.ends_with(" globally excluded"); }),
      2);
}

TEST_F(TransactionTest, MatchOffersEachOfManyOnce) {
  Lines expected;
  for (int i = 0; i < 700; ++i) {
    expected.push_back("com.example." + std::to_string(1000 + i));
    test_.install(sampleRecord(expected.back()));
  }
  EXPECT_EQ(match(), expected);
  const auto reply = serve({{"request", "match"}, {"version", std::uint64_t{2}}});
  EXPECT_EQ(reply, Value(Dictionary())) << "version 2 has no encoding for forms";
}

TEST_F(TransactionTest, MatchSaysWhatItFound) {
  test_.platform.registry->silent = true;
  tests::LogCapture log("ops=info");
  EXPECT_EQ(match(Dictionary{{"x", "y"}}), Lines());
  auto lines = log.take();
  std::erase_if(lines, [](const auto& line) { return line.find(" plugin count: ") == std::string::npos; });
  EXPECT_EQ(lines, Lines({"INFO ops: Candidate plugin count: 0", "INFO ops: Resulting plugin count: 0"}));
  const auto plugIn = test_.install(sampleRecord("com.a", {{XTVersionAttribute, "1.5"}}));
  log.take();
  EXPECT_EQ(match(), Lines{"com.a"});
  lines = log.take();
  const auto has = [&](const std::string& line) { return std::count(lines.begin(), lines.end(), line) == 1; };
  EXPECT_TRUE(has("INFO ops: Candidate plugin count: 1, info: [\"com.a(1.5) " + plugIn->uuid().text() + "\"]"));
  EXPECT_TRUE(has("INFO ops: Resulting plugin count: 1, UUIDs: [\"" + plugIn->uuid().text() + "\"]"));
}

}  // namespace
}  // namespace extora
