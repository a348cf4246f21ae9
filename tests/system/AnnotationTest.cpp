// Annotations over the socket and in the file: they survive whatever becomes of the daemon, the disk and their own
// content.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>

#include <atomic>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <random>
#include <thread>

#include "Extora/XTVocabulary.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/PropertyListKinds.h"
#include "tests/support/Daemon.h"
#include "tests/support/Eventually.h"

namespace extora {
namespace {

using platform::Array;
using platform::Bytes;
using platform::Date;
using platform::Dictionary;
using platform::Value;
using tests::failureOf;

constexpr int kPlugIns = 5;
constexpr const char* kUnsaved = "ERROR ops: unable to save annotations:";

class AnnotationTest : public ::testing::Test {
 protected:
  AnnotationTest() {
    std::vector<tests::SampleBundle> plugIns;
    for (int i = 0; i < kPlugIns; ++i) plugIns.push_back(tests::samplePlugIn("com.example.p" + std::to_string(i)));
    application_ = tests::sampleApplication("com.example.app", std::move(plugIns));
    tests::writeBundle(daemon_.applications(), application_);
    daemon_.start();
    for (const Value& form : daemon_.connect().match({})) {
      uuids_[form["identifier"].string()] = *platform::Uuid::parse(form["uuid"].string());
    }
  }

  const platform::Uuid& uuid(int plugIn) { return uuids_.at("com.example.p" + std::to_string(plugIn)); }
  Dictionary request(int plugIn, const Value& annotations) {
    return {{"request", "annotate"},
            {"version", std::uint64_t{3}},
            {"uuids", Array{uuid(plugIn)}},
            {"annotations", annotations}};
  }
  std::string annotate(int plugIn, const Value& annotations) {
    return failureOf(daemon_.connect().send(request(plugIn, annotations)));
  }
  Value stored(int plugIn) {
    const auto forms = daemon_.connect().match({{XTUUIDAttribute, uuid(plugIn).text()}});
    return forms.size() == 1 ? forms[0]["annotations"] : Value();
  }
  void restart() {
    EXPECT_EQ(daemon_.stop(), 0);
    daemon_.start();
  }
  std::filesystem::path file() const { return daemon_.root() / "Extora-Annotations"; }

  tests::Daemon daemon_;
  tests::SampleBundle application_;
  std::map<std::string, platform::Uuid> uuids_;
};

TEST_F(AnnotationTest, AnElectionIsAnnouncedAndOutlivesDaemonAndPlugIn) {
  const std::string change(XTNotifyAnnotationChange);
  const auto before = daemon_.notificationCount(change);
  EXPECT_EQ(annotate(0, Dictionary{{"election", 2}}), "");
  EXPECT_EQ(failureOf(daemon_.connect().request(
                "bulk-annotate", {{"annotations", Dictionary{{uuid(0).text(), Dictionary{{"k", "v"}}}}}})),
            "");
  EXPECT_EQ(daemon_.notificationCount(change), before + 2);
  const Value both = Dictionary{{"election", 2}, {"extension", Dictionary{{"k", "v"}}}};
  EXPECT_TRUE(stored(0) == both);
  restart();
  EXPECT_TRUE(stored(0) == both);
  EXPECT_EQ(daemon_.connect().offered({{XTUserElectionAttribute, "2"}}),
            std::vector<std::string>{"com.example.p0 1.0"});

  tests::removeBundle(daemon_.applications() / application_.name);
  ASSERT_TRUE(daemon_.waitForLog("plug-in UNINSTALLED:", kPlugIns));
  tests::installBundle(daemon_.applications(), application_);
  ASSERT_TRUE(daemon_.waitForLog("plug-in INSTALLED:", kPlugIns));
  const auto again = daemon_.connect().match({{XTIdentifierAttribute, "com.example.p0"}});
  ASSERT_EQ(again.size(), 1U);
  EXPECT_TRUE(again[0]["annotations"] == both) << "of a plug-in that was installed again";
}

TEST_F(AnnotationTest, OnlyWholeRequestsAreAnnouncedAndAFailureKeepsWhatCameBeforeIt) {
  auto client = daemon_.connect();
  const std::string change(XTNotifyAnnotationChange);
  const auto before = daemon_.notificationCount(change);
  const platform::Uuid unknown = *platform::Uuid::parse("FFFFFFFF-FFFF-4FFF-BFFF-FFFFFFFFFFFF");  // after all others
  const auto both = [&](const char* type, const Value& annotations) {
    return failureOf(client.request(type, {{"annotations", annotations}, {"uuids", Array{uuid(0), uuid(1), unknown}}}));
  };
  const std::string whole = "4 invalid request format (bad annotations dictionary)";
  const Dictionary good{{"k", 1}};
  const auto bulk = [&](const std::string& key, const Value& value) {
    return both("bulk-annotate", Dictionary{{uuid(2).text(), good}, {key, value}});
  };
  for (const Value& wrong : {Value(), Value(Array()), Value("x")}) {
    EXPECT_EQ(both("annotate", wrong), whole);
    EXPECT_EQ(both("bulk-annotate", wrong), whole);
  }
  EXPECT_EQ(both("annotate", Dictionary{{"election", "1"}, {"extension", 1}}),
            "4 invalid request format (annotation election)");
  EXPECT_EQ(both("annotate", Dictionary{{"election", 1}, {"extension", 1}}),
            "4 invalid request format (annotation extension)");
  EXPECT_EQ(both("annotate", Dictionary{{"own", 1}}), "") << "nothing to note: nothing is looked up";
  EXPECT_TRUE(stored(0) == Value(Dictionary()));
  EXPECT_EQ(both("annotate", Dictionary{{"election", 2}, {"own", 1}}), "4 no such plugin (uuid not found)");
  for (const int i : {0, 1}) EXPECT_TRUE(stored(i) == Value(Dictionary{{"election", 2}}));
  EXPECT_EQ(bulk("~", 1), "18 annotations values must be dictionaries");
  EXPECT_EQ(bulk("~", good), "18 invalid plug-in UUID value");
  EXPECT_EQ(bulk(unknown.text(), good), "2 no plug-in with the requested uuid");
  EXPECT_TRUE(stored(2) == Value(Dictionary{{"extension", good}}));
  EXPECT_EQ(daemon_.notificationCount(change), before);
  EXPECT_EQ(failureOf(client.request("bulk-annotate", {{"annotations", Dictionary()}})), "");
  EXPECT_EQ(daemon_.notificationCount(change), before + 1) << "of an empty list too";
  const std::string who = "com.example.p0(" + uuid(0).text() + ") ";
  EXPECT_TRUE(daemon_.waitForLog("plug-in " + who + "annotation change: {election: 2}\n"));
  EXPECT_TRUE(daemon_.waitForLog("plug-in " + who + "election := 2\n"));
  EXPECT_TRUE(daemon_.waitForLog(" bulk plug-in com.example.p2(" + uuid(2).text() + ") annotation change: {k: 1}\n"));
}

// A stream of annotations, each a number one higher than the last, to one plug-in after the other; the daemon is killed
// at any moment. Afterwards the numbers are those of one moment not before the last acknowledged one.
TEST_F(AnnotationTest, AKilledDaemonKeepsWhatItAcknowledgedAndMixesNothing) {
  const char* const wanted = std::getenv("EXTORA_TEST_KILLS");
  const int kills = wanted != nullptr ? std::atoi(wanted) : 20;
  const auto seed = std::random_device()();
  SCOPED_TRACE("seed " + std::to_string(seed));
  std::mt19937 random(seed);
  const auto below = [&](int bound) { return static_cast<int>(random() % static_cast<unsigned>(bound)); };
  constexpr int kStream = 60;
  int last = 0;  // the number that was stored last
  int midway = 0;
  for (int kill = 0; kill < kills && !HasFailure(); ++kill) {
    std::atomic<int> acknowledged = 0;
    std::atomic<int> returned = 0;
    const std::string filling(static_cast<std::size_t>(below(20'000)), 'x');
    {
      auto client = daemon_.connect();
      for (int i = 1; i <= kStream; ++i) {
        const Value extension = Dictionary{{"number", last + i}, {"filling", filling}};
        client.connection().sendWithReply(request((last + i) % kPlugIns, Dictionary{{"extension", extension}}),
                                          client.queue(), [&](const platform::IpcReplyObject& reply) {
                                            if (!reply.error) ++acknowledged;
                                            ++returned;
                                          });
      }
      const int first = below(kStream);
      EXPECT_TRUE(tests::eventually([&] { return acknowledged >= first; }));
      // Not to wait for anything: this is the moment that is tried.
      std::this_thread::sleep_for(std::chrono::microseconds(below(3'000)));
      daemon_.process().signal(SIGKILL);
      EXPECT_EQ(daemon_.process().wait(), 128 + SIGKILL);
      EXPECT_TRUE(tests::eventually([&] { return returned == kStream; }));
    }
    daemon_.start();
    EXPECT_EQ(daemon_.countInLog("(resetting)"), 0U);
    std::vector<int> numbers;
    for (int i = 0; i < kPlugIns; ++i) {
      numbers.push_back(static_cast<int>(stored(i)["extension"]["number"].integerValue()));
    }
    const int newest = *std::max_element(numbers.begin(), numbers.end());
    EXPECT_GE(newest, last + acknowledged);
    EXPECT_LE(newest, last + kStream);
    for (int number = std::max(newest - kPlugIns + 1, 1); number <= newest; ++number) {
      EXPECT_EQ(numbers[static_cast<std::size_t>(number % kPlugIns)], number) << "the newest is " << newest;
    }
    if (newest < last + kStream) ++midway;
    last = newest;
  }
  EXPECT_GT(midway, 0) << "no kill came before the end of the stream";
}

TEST_F(AnnotationTest, WhatCannotBeWrittenIsKeptInMemoryAndWrittenLater) {
  EXPECT_EQ(annotate(0, Dictionary{{"election", 1}}), "");
  const auto limitFiles = [&](rlim_t bytes) {
    const rlimit limit{bytes, RLIM_INFINITY};
    ASSERT_EQ(::prlimit(daemon_.process().pid(), RLIMIT_FSIZE, &limit, nullptr), 0);
  };
  limitFiles(100);
  EXPECT_EQ(annotate(1, Dictionary{{"election", 2}}), "");
  EXPECT_TRUE(daemon_.waitForLog(kUnsaved + ("file://" + file().string()) + " error:POSIX 27: "));
  EXPECT_TRUE(stored(1)["election"] == Value(2));
  EXPECT_FALSE(std::filesystem::exists(file().string() + ".tmp"));
  daemon_.process().signal(SIGKILL);
  EXPECT_EQ(daemon_.process().wait(), 128 + SIGKILL);
  daemon_.start();
  EXPECT_TRUE(stored(0)["election"] == Value(1)) << "the old file stands";
  EXPECT_TRUE(stored(1)["election"].isNothing());

  limitFiles(100);
  EXPECT_EQ(annotate(1, Dictionary{{"election", 2}}), "");
  limitFiles(RLIM_INFINITY);
  EXPECT_EQ(annotate(2, Dictionary{{"election", 3}}), "");
  EXPECT_TRUE(daemon_.waitForLog(kUnsaved));
  restart();
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(stored(i)["election"] == Value(i + 1));
}

// All the characters that XML can carry.
std::string everyCharacter() {
  std::string text = "<plist version=\"1.0\"><string>&#9;&#10;&#13;";
  for (std::uint32_t c = 0x20; c <= 0x10FFFF; ++c) {
    if (c < 0xD800 || (c > 0xDFFF && c != 0xFFFE && c != 0xFFFF)) text += "&#" + std::to_string(c) + ";";
  }
  text += "</string></plist>";
  return platform::parsePropertyList(Bytes(text.begin(), text.end()), nullptr).string();
}

TEST_F(AnnotationTest, WhateverTheWireCarriesLoadsAgain) {
  Bytes everyByte(256);
  for (std::size_t i = 0; i < everyByte.size(); ++i) everyByte[i] = static_cast<std::uint8_t>(i);
  // Body, "annotations" and "extension" are three levels, the dictionary below one more: 64 in all.
  Value deep = Array();
  for (int i = 0; i < 59; ++i) deep = Array{deep};
  const Value unwritable = Array(std::vector<Value>(400'000, Value(std::nan(""))));
  using Limits = std::numeric_limits<double>;
  const Dictionary odd{
      {"strings", Array{everyCharacter(), "", " ", " \r\n ", "]]>", "<!-- &amp; &#0; -->", "\xEF\xBB\xBF"}},
      {"keys", Dictionary{{"", 1}, {" ", 2}, {"\r\n", 3}, {"</key>&lt;", 4}, {std::string(1 << 20, 'k'), 5}}},
      {"booleans", Array{true, false}},
      {"integers", Array{std::numeric_limits<std::int64_t>::min(), -1, 0, std::numeric_limits<std::int64_t>::max(),
                         std::numeric_limits<std::uint64_t>::max(), 7U}},
      {"reals", Array{0.0, -0.0, 0.1, 1.0, 1e300, Limits::max(), Limits::min(), Limits::denorm_min(), -1e-310,
                      Limits::infinity(), Limits::quiet_NaN()}},
      {"data", Array{Value::data(everyByte), Value::data({}), Value::data(Bytes(1 << 20, 0xFF))}},
      {"dates", Array{Date{-62'167'219'200, 0}, Date{-62'167'219'201, 0}, Date{253'402'300'799, 999'999'999},
                      Date{253'402'300'800, 0}, Date{-1, 1}, Date{0, 0}}},
      {"uuid", uuid(0)},
      {"empty", Array{Array(), Dictionary()}},
      {"deep", deep},
      {"unwritable", unwritable}};
  const Dictionary expected(platform::toPropertyListKinds(odd));
  EXPECT_EQ(expected["strings"].at(0).string().size(), 4'382'557U);
  EXPECT_EQ(expected["reals"].size(), 9U);
  EXPECT_EQ(expected["dates"].size(), 4U);
  EXPECT_EQ(expected["unwritable"].size(), 0U);
  const Value elections[] = {std::numeric_limits<std::uint64_t>::max(), std::numeric_limits<std::int64_t>::min(), 1.5,
                             true};
  EXPECT_EQ(annotate(0, Dictionary{{"extension", odd}}), "");
  for (int i = 0; i < 4; ++i) EXPECT_EQ(annotate(i + 1, Dictionary{{"election", elections[i]}}), "");
  // Five bytes in the file for each on the wire.
  const std::string longest((16U << 20) - 200, '\r');
  EXPECT_EQ(annotate(4, Dictionary{{"extension", Dictionary{{"longest", longest}}}}), "");
  for (const bool again : {false, true}) {
    SCOPED_TRACE(again ? "after a restart" : "before a restart");
    if (again) restart();
    const Value extension = stored(0)["extension"];
    for (const auto& [key, value] : expected) EXPECT_TRUE(extension[key] == value) << key;
    EXPECT_EQ(extension.size(), expected.size());
    EXPECT_TRUE(std::signbit(extension["reals"].at(1).realValue())) << "-0.0";
    for (int i = 0; i < 4; ++i) EXPECT_TRUE(stored(i + 1)["election"] == elections[i]) << i;
    EXPECT_TRUE(stored(4)["extension"]["longest"].string() == longest);
    EXPECT_EQ(daemon_.countInLog("(resetting)") + daemon_.countInLog(kUnsaved), 0U);
  }
}

// For `make soak`, as is the test of the killed daemon with more kills.
using AnnotationSoak = AnnotationTest;

// No save is larger than what loads.
TEST_F(AnnotationSoak, MoreThanTheFileHoldsIsNotSavedAndHarmsNothing) {
  const Value large = Dictionary{{"extension", Dictionary{{"k", std::string((16U << 20) - 200, '\r')}}}};
  for (int i = 0; i < 4; ++i) EXPECT_EQ(annotate(i, large), "");
  EXPECT_TRUE(
      daemon_.waitForLog(kUnsaved + ("file://" + file().string()) +
                         " error:PropertyList 2: a document of this length cannot be written as a property list\n"));
  EXPECT_EQ(daemon_.countInLog(kUnsaved), 1U);
  EXPECT_TRUE(stored(3) == large) << "memory stands";
  restart();
  EXPECT_EQ(daemon_.countInLog("(resetting)"), 0U);
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(stored(i) == large) << i;
  EXPECT_TRUE(stored(3) == Value(Dictionary()));
}

}  // namespace
}  // namespace extora
