#include <gtest/gtest.h>

#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"
#include "tests/support/TestServer.h"

namespace extora {
namespace {

using platform::Array;
using Lines = std::vector<std::string>;

class TransactionAnnotationsTest : public ::testing::Test {
 protected:
  Value annotate(const Value& annotations, const Array& uuids) {
    return test_.serve(*connection_,
                       {{"request", "annotate"}, {"version", 3U}, {"annotations", annotations}, {"uuids", uuids}});
  }
  Value bulk(const Value& annotations) {
    return test_.serve(*connection_, {{"request", "bulk-annotate"}, {"version", 3U}, {"annotations", annotations}});
  }
  static Value failure(std::uint64_t code, const char* text) {
    return Dictionary{{"errorcode", code}, {"error", text}};
  }
  Value stored(const XTDPlugIn& plugIn) { return test_.server->annotationForPlugIn(plugIn); }
  std::size_t posted() { return test_.platform.notifications->posted.size(); }

  tests::TestServer test_;
  std::shared_ptr<tests::FakeConnection> connection_ = std::make_shared<tests::FakeConnection>();
  std::shared_ptr<XTDIpcClient> client_ = test_.connect(connection_);
  std::shared_ptr<XTDPlugIn> a_ = test_.install(tests::sampleRecord("com.a"));
  std::shared_ptr<XTDPlugIn> b_ = test_.install(tests::sampleRecord("com.b"));
};

TEST_F(TransactionAnnotationsTest, AnnotateKeepsElectionAndExtensionOnly) {
  tests::LogCapture log("ops=debug");
  const Dictionary extension{{"k", a_->uuid()}};
  EXPECT_EQ(annotate(Dictionary{{"election", 1U}, {"extension", extension}, {"own", 5}}, {a_->uuid()}),
            Value(Dictionary()));
  EXPECT_EQ(stored(*a_), Value(Dictionary{{"election", 1}, {"extension", Dictionary{{"k", a_->uuid().text()}}}}));
  EXPECT_EQ(posted(), 1U);
  const std::string who = fmt::format("client {} plug-in com.a({}) ", getpid(), a_->uuid());
  const Lines lines = log.take();
  const auto first =
      std::find_if(lines.begin(), lines.end(), [&](const auto& line) { return line.ends_with("election := 1"); });
  ASSERT_NE(first, lines.end());
  EXPECT_EQ(*first, "INFO ops: " + who + "election := 1");
  EXPECT_EQ(*(first - 1), "DEBUG ops: " + who + "annotation change: " + stored(*a_).describe());

  EXPECT_EQ(annotate(Dictionary{{"own", 5}}, {Uuid::random()}), Value(Dictionary())) << "nothing is looked up";
  EXPECT_EQ(posted(), 1U);
}

TEST_F(TransactionAnnotationsTest, AnnotateRefusesMalformedAnnotationsAndChangesNothing) {
  const char* whole = "invalid request format (bad annotations dictionary)";
  EXPECT_EQ(annotate(Value(), {a_->uuid()}), failure(4, whole));
  EXPECT_EQ(annotate(Array(), {a_->uuid()}), failure(4, whole));
  const Dictionary both{{"election", "1"}, {"extension", 1}};
  EXPECT_EQ(annotate(both, {a_->uuid()}), failure(4, "invalid request format (annotation election)"));
  EXPECT_EQ(annotate(Dictionary{{"election", 1}, {"extension", 1}}, {a_->uuid()}),
            failure(4, "invalid request format (annotation extension)"));
  EXPECT_TRUE(stored(*a_).isNothing());
  EXPECT_EQ(posted(), 0U);
}

TEST_F(TransactionAnnotationsTest, AnnotateStopsAtAnUnknownPlugInWithoutANotification) {
  EXPECT_EQ(annotate(Dictionary{{"election", 2}}, {a_->uuid(), b_->uuid(), Uuid::random()}),
            failure(4, "no such plugin (uuid not found)"));
  EXPECT_EQ(stored(*a_), Value(Dictionary{{"election", 2}}));
  EXPECT_EQ(stored(*b_), Value(Dictionary{{"election", 2}}));
  EXPECT_EQ(posted(), 0U);
}

TEST_F(TransactionAnnotationsTest, BulkAnnotateNeverTouchesAnElection) {
  EXPECT_EQ(bulk(Dictionary()), Value(Dictionary()));
  EXPECT_EQ(posted(), 1U) << "posted for an empty list too";
  annotate(Dictionary{{"election", 1}}, {a_->uuid()});
  const Dictionary extension{{"election", 0}};
  tests::LogCapture log("ops=debug");
  EXPECT_EQ(bulk(Dictionary{{a_->uuid().text(), extension}}), Value(Dictionary()));
  EXPECT_EQ(stored(*a_), Value(Dictionary{{"election", 1}, {"extension", extension}}));
  EXPECT_EQ(posted(), 3U);
  const Lines lines = log.take();
  const std::string change = fmt::format("DEBUG ops: client {} bulk plug-in com.a({}) annotation change: {}", getpid(),
                                         a_->uuid(), Value(extension));
  EXPECT_EQ(std::count(lines.begin(), lines.end(), change), 1);
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "DEBUG ops: bulk change requested for 1 plug-ins"), 1);
}

TEST_F(TransactionAnnotationsTest, BulkAnnotateStopsAtTheFirstBadEntry) {
  EXPECT_EQ(bulk("x"), failure(4, "invalid request format (bad annotations dictionary)"));
  const std::string known = a_->uuid().text();
  const std::string unknown = "FFFFFFFF-FFFF-4FFF-BFFF-FFFFFFFFFFFF";  // after every other one
  const Dictionary good{{"k", 1}};
  EXPECT_EQ(bulk(Dictionary{{known, good}, {unknown, 1}}), failure(18, "annotations values must be dictionaries"));
  EXPECT_EQ(bulk(Dictionary{{known, good}, {"~", 1}}), failure(18, "annotations values must be dictionaries"));
  EXPECT_EQ(bulk(Dictionary{{known, good}, {"~", good}}), failure(18, "invalid plug-in UUID value"));
  EXPECT_EQ(bulk(Dictionary{{known, Dictionary{{"k", 2}}}, {unknown, good}}),
            failure(2, "no plug-in with the requested uuid"));
  EXPECT_EQ(stored(*a_), Value(Dictionary{{"extension", Dictionary{{"k", 2}}}})) << "handled before the failing one";
  EXPECT_EQ(posted(), 0U);
}

}  // namespace
}  // namespace extora
