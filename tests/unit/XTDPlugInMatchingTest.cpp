#include <gtest/gtest.h>

#include "tests/support/FakeRegistry.h"
#include "tests/support/LogCapture.h"
#include "tests/support/PrintDescribed.h"
#include "xtd/XTDPlugIn.h"

namespace extora {
namespace {

using platform::Array;
using platform::Date;

class XTDPlugInMatchingTest : public ::testing::Test {
 protected:
  XTDPlugInMatchingTest() {
    registry_->conformances = {{"jpeg", "image"}};
    platform::ARExtoraProxy record =
        tests::sampleRecord("com.a",
                            {{"version", "1.10"},
                             {"one", "1.0"},
                             {"type", "jpeg"},
                             {"base", "image"},
                             {"list", Array{"x", 5, "b"}},
                             {"none", Array()},
                             {"number", 3},
                             {"yes", true},
                             {"zero", 0},
                             {"rule", Dictionary{{"image", 2}}},
                             {"HXUserElection", "7"},  // no database here: the attribute stands in for the election
                             {"both", "attribute"}},
                            Dictionary{{"on", true}, {"one", 1}, {"text", "t"}, {"off", false}, {"zero", 0}});
    record.plugInUUID = Uuid::parse("0a000000-0000-4000-8000-00000000000b");
    Dictionary info(record.infoDictionary);
    info.set("both", "info");
    info.set("plain", "info");
    record.infoDictionary = info;
    plugIn_ = XTDPlugIn::initWithARData(registry_->install(record), registry_, {});
    platform::ARExtoraProxy outside = tests::sampleRecord("com.b");
    outside.bundleURL = Url::file("/System/com.b.appex");
    outside_ = XTDPlugIn::initWithARData(platform::plugInRecord(registry_->install(std::nullopt, {outside}), 0),
                                         registry_, {});
  }

  std::shared_ptr<tests::FakeRegistry> registry_ = std::make_shared<tests::FakeRegistry>();
  std::shared_ptr<XTDPlugIn> plugIn_;
  std::shared_ptr<XTDPlugIn> outside_;
};

TEST_F(XTDPlugInMatchingTest, EveryKeyAndPatternForm) {
  const Dictionary items{{"accepted", Dictionary{{"image", 2}}}};
  const struct {
    const char* key;
    Value yes;  // a pattern that matches
    Value no;   // one that does not
  } rows[] = {
      // Keys.
      {"HXExtensionIdentifier", "com.a", "com.b"},
      {"HXExtensionIdentifier", "<>com.b", "<>com.a"},
      {"com.orvane.uuid", "0A000000-0000-4000-8000-00000000000B", "0a000000-0000-4000-8000-00000000000b"},
      {"HXUserElection", "7", "0"},
      {"HXExtensionContainingApp", "/Apps/com.a.app", "/Apps/com.b.app"},
      {"HXExtensionContainingApp", true, false},
      {"both", "attribute", "info"},
      {"plain", "info", "attribute"},
      {"ENTITLEMENT:on", true, false},
      {"ENTITLEMENT:one", 1, 0},
      {"ENTITLEMENT:text", true, false},
      {"ENTITLEMENT:text", "t", "u"},
      {"ENTITLEMENT:off", false, true},
      {"ENTITLEMENT:zero", 0, 1},
      {"ENTITLEMENT:absent", false, true},
      {"ENTITLEMENT:absent", 0, "t"},
      {"ENTITLEMENT:version", false, true},  // attributes are not consulted
      // Operators, in the numeric order.
      {"version", "1.10", "1.1"},
      {"version", "=1.10", "=1.9"},
      {"version", "<>1.9", "<>1.10"},
      {"version", ">=1.9", "<=1.9"},
      {"version", ">=1.10", ">1.10"},
      {"version", "<=1.10", "<1.10"},
      {"version", ">1.9", "<1.9"},
      {"version", "<1.11", ">=1.11"},
      {"one", "<>1", "1"},
      {"one", "<> 1.0", "= 1.0"},  // the operand is the rest, as it stands
      {"type", "?KD-CONFORMS:image", "?KD-IS:image"},
      {"base", "?KD-IS:jpeg", "?KD-CONFORMS:jpeg"},
      {"type", "?KD-CONFORMS:jpeg", "?KD-CONFORMS"},
      {"type", "?KD-IS:jpeg", "?kd-is:jpeg"},
      // Alternatives on either side; only strings compare.
      {"one", Array{"a", 1, "1.0"}, Array{"a", 1}},
      {"one", Array{"1.0"}, Array()},
      {"list", "b", "a"},
      {"list", Array{"a", "x"}, Array{"a", "5"}},
      {"none", true, "x"},
      {"number", true, "3"},
      {"number", 1, 3},
      {"yes", 1.0, 2},
      {"zero", false, true},
      {"absent", false, "<>x"},
      // Activation rules.
      {"rule", items, Dictionary{{"accepted", 1}}},
      {"rule", true, "rule"},
  };
  for (const auto& row : rows) {
    EXPECT_TRUE(plugIn_->match(Dictionary{{row.key, row.yes}})) << row.key << " " << row.yes.describe();
    EXPECT_FALSE(plugIn_->match(Dictionary{{row.key, row.no}})) << row.key << " " << row.no.describe();
  }
}

TEST_F(XTDPlugInMatchingTest, WhatNeverMatches) {
  const Value patterns[] = {"<>4", Array{"<>4", "3"}, 3, 2.5, Dictionary{{"x", 1}}, Date{}};
  for (const Value& pattern : patterns) {
    EXPECT_FALSE(plugIn_->match(Dictionary{{"number", pattern}})) << pattern.describe();
    EXPECT_FALSE(plugIn_->match(Dictionary{{"absent", pattern}})) << pattern.describe();
  }
  for (const Value& pattern : {Value(true), Value(false), Value("<>x")}) {
    EXPECT_FALSE(outside_->match(Dictionary{{"HXExtensionContainingApp", pattern}})) << pattern.describe();
  }
  EXPECT_FALSE(plugIn_->match("rules")) << "rules that are no dictionary";
}

TEST_F(XTDPlugInMatchingTest, AllRulesMustHoldAndNoneMatchesEverything) {
  EXPECT_TRUE(plugIn_->match(Value()));
  EXPECT_TRUE(plugIn_->match(Dictionary()));
  EXPECT_TRUE(plugIn_->match(Dictionary{{"version", ">1"}, {"one", "1.0"}}));
  EXPECT_FALSE(plugIn_->match(Dictionary{{"version", ">1"}, {"one", "2.0"}}));
}

TEST_F(XTDPlugInMatchingTest, AnUnknownTypeTestIsLoggedWithItsWholePattern) {
  tests::LogCapture log("info");
  EXPECT_FALSE(plugIn_->match(Dictionary{{"list", "?KD-LIKES:b"}}));
  const std::string line = "INFO ops: unrecognized match operator:?KD-LIKES:b";
  EXPECT_EQ(log.take(), (std::vector{line, line})) << "once for each string of the list";
  EXPECT_FALSE(plugIn_->match(Dictionary{{"number", "?KD-LIKES:b"}}));
  EXPECT_EQ(log.take(), std::vector<std::string>()) << "a number is not compared at all";
}

}  // namespace
}  // namespace extora
