#include "platform/value/Value.h"

#include <gtest/gtest.h>

#include <limits>

#include "platform/value/InternalInconsistency.h"
#include "platform/value/PropertyListKinds.h"
#include "tests/support/PrintDescribed.h"

namespace platform {
namespace {

constexpr std::uint64_t kTwo53 = std::uint64_t{1} << 53;
constexpr std::uint64_t kTwo63 = std::uint64_t{1} << 63;
constexpr std::int64_t kLeast = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();
const double kNan = std::numeric_limits<double>::quiet_NaN();
const double kInfinity = std::numeric_limits<double>::infinity();

TEST(ValueTest, ExactReadsTakeOneKindAndNumericReadsAnyNumber) {
  EXPECT_EQ(Value(3).exactUnsigned(), 0U);
  EXPECT_EQ(Value(3U).exactUnsigned(), 3U);
  EXPECT_EQ(Value(3U).exactSigned(), 0);
  EXPECT_FALSE(Value(1).exactBoolean());

  EXPECT_EQ(Value(true).integerValue(), 1);
  EXPECT_EQ(Value(-1.9).integerValue(), -1);
  EXPECT_EQ(Value(kTwo63).integerValue(), 0);
  EXPECT_EQ(Value(9223372036854775808.0).integerValue(), 0);
  EXPECT_EQ(Value(-9223372036854775808.0).integerValue(), kLeast);
  EXPECT_EQ(Value(kNan).integerValue(), 0);
  EXPECT_EQ(Value(-1).unsignedValue(), 0U);
  EXPECT_EQ(Value(9223372036854775808.0).unsignedValue(), kTwo63);
  EXPECT_EQ(Value(18446744073709551616.0).unsignedValue(), 0U);
  EXPECT_EQ(Value(kTwo63).realValue(), 9223372036854775808.0);
  EXPECT_TRUE(Value(-2).booleanValue());
  EXPECT_TRUE(Value(kTwo63).booleanValue());
  EXPECT_FALSE(Value(0.5).booleanValue());
  EXPECT_FALSE(Value(kNan).booleanValue());
  EXPECT_FALSE(Value("1").booleanValue());
}

TEST(ValueTest, NumbersAreEqualByExactValueWhateverTheirKind) {
  EXPECT_EQ(Value(1), Value(1U));
  EXPECT_EQ(Value(true), Value(1.0));
  EXPECT_EQ(Value(false), Value(-0.0));
  EXPECT_EQ(Value(kLeast), Value(-9223372036854775808.0));
  EXPECT_EQ(Value(kTwo53), Value(9007199254740992.0));
  EXPECT_EQ(Array{1U}, Array{true});
  // A conversion to a real would make these equal, a conversion between signed and unsigned the last two.
  EXPECT_NE(Value(kTwo53 + 1), Value(9007199254740992.0));
  EXPECT_NE(Value(kMost), Value(9223372036854775808.0));
  EXPECT_NE(Value(std::numeric_limits<std::uint64_t>::max()), Value(18446744073709551616.0));
  EXPECT_NE(Value(-1), Value(std::numeric_limits<std::uint64_t>::max()));
  EXPECT_NE(Value(kLeast), Value(kTwo63));
  EXPECT_NE(Value(1), Value(1.5));
  EXPECT_NE(Value(kNan), Value(0));
  EXPECT_NE(Value(kInfinity), Value(kMost));
}

TEST(ValueTest, DictionariesStaySortedAndKeepNoNothing) {
  Dictionary dictionary{{"b", 1}, {"a", 2}, {"gone", Value()}, {"b", 3}};
  EXPECT_EQ(dictionary.size(), 2U);
  EXPECT_EQ(dictionary["b"], Value(3));
  for (const char* key : {"z", "ab", "\xC3\xA9", "", "B", "c1", "c2", "c3", "c4", "c5"}) dictionary.set(key, key);
  for (std::size_t i = 1; i < dictionary.size(); ++i) {
    EXPECT_LT(dictionary.entries()[i - 1].key, dictionary.entries()[i].key);
  }
  EXPECT_EQ(dictionary.entries().back().key, "\xC3\xA9");
  for (const auto& [key, value] : dictionary) EXPECT_EQ(dictionary[key], value);
  EXPECT_FALSE(dictionary.contains("c6"));
  dictionary.set("z", Value());
  dictionary.remove("ab");
  dictionary.remove("never there");
  EXPECT_EQ(dictionary.size(), 10U);

  std::vector<Value::Entry> entries{{"k", 1}, {"a", Value()}, {"k", 2}, {"k", 3}};
  EXPECT_EQ(Dictionary(std::move(entries)), (Dictionary{{"k", 3}}));
}

TEST(ValueTest, AWriteNeverReachesWhoeverSharesTheNode) {
  Dictionary inner{{"x", 1}};
  const Value before = Dictionary{{"inner", inner}, {"list", Array{1, 2}}};
  Dictionary copy(before);
  inner.set("x", 2);
  Array list(copy["list"]);
  list.append(3);
  list.set(0, "first");
  copy.set("list", list);
  EXPECT_EQ(before, Value(Dictionary{{"inner", Dictionary{{"x", 1}}}, {"list", Array{1, 2}}}));
  EXPECT_EQ(copy["list"], Value(Array{"first", 2, 3}));
  EXPECT_TRUE(before["inner"].identicalTo(copy["inner"]));
  EXPECT_FALSE(before.identicalTo(Value(copy)));
  // Elements of a container may be put back into it while it is written.
  for (int i = 0; i < 100; ++i) list.append(list[0]);
  EXPECT_EQ(list[102], Value("first"));
  EXPECT_THROW(list.set(103, 0), InternalInconsistency);
}

TEST(ValueTest, PropertyListKindsAreWhatAFileGivesBack) {
  const Uuid uuid = Uuid::random();
  const Value converted = toPropertyListKinds(Dictionary{
      {"date", Date{-5, 900}},
      {"list", Array{uuid, Value::message({0xC3}), kNan, 5U, Array{kInfinity}}},
      {"message", Value::message({})},
      {"unsigned", kTwo63},
      {"text", "t"},
  });
  EXPECT_EQ(
      converted.describe(),
      Value(Dictionary{
                {"date", Date{-5, 0}}, {"list", Array{uuid.text(), 5, Array()}}, {"unsigned", kTwo63}, {"text", "t"}})
          .describe());
  EXPECT_EQ(converted["list"].at(1).kind(), Kind::Signed);
  EXPECT_EQ(converted["unsigned"].kind(), Kind::Unsigned);
  EXPECT_TRUE(toPropertyListKinds(kNan).isNothing());
  EXPECT_TRUE(toPropertyListKinds(converted).identicalTo(converted));
}

}  // namespace
}  // namespace platform
