#include "tools/RuleArguments.h"

#include <gtest/gtest.h>

namespace {

using platform::Array;
using platform::Dictionary;
using tools::rulesFromArguments;

TEST(RuleArgumentsTest, AKeyGivenAgainAddsAnAlternativeAndReplacesTheFiles) {
  std::string fault;
  const Dictionary file{{"A", Array({"x", "y"})}, {"B", "b"}};
  const Dictionary expected{{"A", Array({"1", "2", "3"})}, {"B", "b"}};
  EXPECT_EQ(rulesFromArguments({"A=1", "A=2", "A=3"}, file, fault), expected);

  EXPECT_EQ(rulesFromArguments({"A=1", "A=true"}, {}, fault), std::nullopt);
  EXPECT_NE(fault.find("(rule A)"), std::string::npos) << fault;
}

}  // namespace
