#include "tools/RuleArguments.h"

#include <gtest/gtest.h>

namespace {

using platform::Array;
using platform::Dictionary;
using tools::ruleFault;
using tools::rulesFromArguments;

TEST(RuleArgumentsTest, TheFirstEqualsSignEndsTheKey) {
  std::string fault;
  const Dictionary expected{{"A", "=1"}, {"B", ">=1.9"}, {"C", ""}, {"D", true}, {"E", false}, {"F", "=true"}};
  EXPECT_EQ(rulesFromArguments({"A==1", "B=>=1.9", "C=", "D=true", "E=false", "F==true"}, {}, fault), expected);
  EXPECT_EQ(fault, "");

  EXPECT_EQ(ruleFault("A=1"), "");
  EXPECT_NE(ruleFault("A"), "");
  EXPECT_NE(ruleFault("=1"), "");
  EXPECT_NE(ruleFault("A=\xff"), "");
}

TEST(RuleArgumentsTest, AKeyGivenAgainAddsAnAlternativeAndReplacesTheFiles) {
  std::string fault;
  const Dictionary file{{"A", Array({"x", "y"})}, {"B", "b"}};
  const Dictionary expected{{"A", Array({"1", "2", "3"})}, {"B", "b"}};
  EXPECT_EQ(rulesFromArguments({"A=1", "A=2", "A=3"}, file, fault), expected);

  EXPECT_EQ(rulesFromArguments({"A=1", "A=true"}, {}, fault), std::nullopt);
  EXPECT_NE(fault.find("(rule A)"), std::string::npos) << fault;
}

}  // namespace
