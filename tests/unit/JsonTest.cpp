#include "tools/Json.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>

#include "platform/ipc/IpcCodec.h"

namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using tools::jsonText;

TEST(JsonTest, EveryKindHasItsForm) {
  EXPECT_EQ(jsonText(Value()), "null\n");
  EXPECT_EQ(jsonText(true), "true\n");
  EXPECT_EQ(jsonText(std::numeric_limits<std::int64_t>::min()), "-9223372036854775808\n");
  EXPECT_EQ(jsonText(std::numeric_limits<std::uint64_t>::max()), "18446744073709551615\n");
  EXPECT_EQ(jsonText(0.1), "0.1\n");
  EXPECT_EQ(jsonText(std::numeric_limits<double>::infinity()), "null\n");
  EXPECT_EQ(jsonText(platform::Date{0, 0}), "\"1970-01-01T00:00:00Z\"\n");
  EXPECT_EQ(jsonText(*platform::Uuid::parse("8c0a1b2c-3d4e-4f60-8182-93a4b5c6d7e8")),
            "\"8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8\"\n");
  EXPECT_EQ(jsonText(Value::data({})), "\"\"\n");
  EXPECT_EQ(jsonText(Value::data({0xfb, 0xff})), "\"+/8=\"\n");
  EXPECT_EQ(jsonText(platform::toWireMessage(Array({1, 2}))), "[\n  1,\n  2\n]\n");
}

TEST(JsonTest, CollectionsNestAndTextIsSafeOnATerminal) {
  EXPECT_EQ(jsonText(Array()), "[]\n");
  EXPECT_EQ(jsonText(Dictionary()), "{}\n");
  EXPECT_EQ(jsonText(Dictionary{{"b", Array({Dictionary{{"c", "d"}}})},
                                {"a \"\\",
                                 "\t\r\n\x7f"
                                 "\u009b31m Grüße €"}}),
            "{\n"
            "  \"a \\\"\\\\\": \"\\t\\u000d\\n\\u007f\\u009b31m Grüße €\",\n"
            "  \"b\": [\n"
            "    {\n"
            "      \"c\": \"d\"\n"
            "    }\n"
            "  ]\n"
            "}\n");
}

}  // namespace
