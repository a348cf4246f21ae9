// Values as text: descriptions, errors, UUIDs, URLs, dates, the numeric order.
#include <gtest/gtest.h>

#include <unordered_set>

#include "platform/value/DateText.h"
#include "platform/value/Describe.h"
#include "platform/value/NumericOrder.h"
#include "platform/value/Url.h"
#include "platform/value/Utf8.h"
#include "platform/value/Value.h"
#include "tests/support/PrintDescribed.h"

namespace platform {
namespace {

TEST(ValueTextTest, EveryKindDescribesItselfOnOneLine) {
  const Uuid uuid = *Uuid::parse("8c0a1b2c-3d4e-4f60-8182-93a4b5c6d7e8");
  const Value value = Dictionary{
      {"a", Array{-1, 2U, 1.5, true, Value()}},
      {"b", R"(say "\")"},
      {"d", Value::data({0x00, 0xFF})},
      {"e", Value::data(Bytes(33))},
      {"m", Value::message({1, 2, 3})},
      {"t", Date{1'795'377'600, 500'000'000}},
      {"u", uuid},
  };
  EXPECT_EQ(value.describe(),
            R"({a: [-1, 2, 1.5, true, (null)], b: "say \"\\\"", d: <2 bytes 00ff>, e: <33 bytes>, )"
            R"(m: <message 3 bytes>, t: 2026-11-22T20:00:00.5Z, u: 8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8})");
  EXPECT_EQ(fmt::format("{}|{}|{}", Value("plain \"text\""), Value(), uuid),
            "plain \"text\"|(null)|8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8");
}

TEST(ValueTextTest, UuidsAreReadInEitherCaseAndWrittenInUpperCase) {
  const std::string upper = "8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8";
  EXPECT_EQ(Uuid::parse(upper)->text(), upper);
  EXPECT_EQ(Uuid::parse("8c0a1b2c-3d4e-4f60-8182-93a4b5c6d7e8"), Uuid::parse(upper));
  EXPECT_EQ(Uuid::parse(upper)->bytes()[15], 0xE8);
  for (const char* text : {"", "8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E", "8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E80",
                           "8C0A1B2C03D4E-4F60-8182-93A4B5C6D7E8", "8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7EG",
                           "{C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E}", "8C0A1B2C3D4E4F60818293A4B5C6D7E8"}) {
    EXPECT_EQ(Uuid::parse(text), std::nullopt) << text;
  }
  std::unordered_set<Uuid> seen;
  for (int i = 0; i < 100; ++i) {
    const Uuid uuid = Uuid::random();
    EXPECT_EQ(uuid.text()[14], '4');
    EXPECT_NE(std::string("89AB").find(uuid.text()[19]), std::string::npos);
    EXPECT_TRUE(seen.insert(uuid).second);
  }
}

TEST(ValueTextTest, FileUrlsNameAPath) {
  const std::pair<const char*, const char*> good[] = {{"file:///a/b", "/a/b"},
                                                      {"file:///a/b/", "/a/b"},
                                                      {"file:///", "/"},
                                                      {"file:/a", "/a"},
                                                      {"file://localhost/a", "/a"},
                                                      {"FILE://LocalHost/a%20b%2fc", "/a b/c"},
                                                      {"file:///gr%C3%BCn", "/gr\xC3\xBCn"},
                                                      {"file:///a/?query#fragment", "/a"},
                                                      {"file:///a#f?q", "/a"},
                                                      {"file:///a%3Fb%23c%25", "/a?b#c%"}};
  for (const auto& [text, path] : good) {
    const std::optional<Url> url = Url::parse(text);
    ASSERT_TRUE(url) << text;
    EXPECT_EQ(url->path(), path);
    EXPECT_EQ(Url::parse(url->absoluteString()), url) << url->absoluteString();
  }
  for (const char* text : {"", "/a/b", "a", "file:", "file://", "file://host/a", "file:a", "http:///a", "file:///a%",
                           "file:///a%2", "file:///a%GG", "file:///a%00", "file:///%FF", "file://localhost"}) {
    EXPECT_EQ(Url::parse(text), std::nullopt) << text;
  }
}

TEST(ValueTextTest, DatesAreReadAndWrittenToTheSecond) {
  for (const auto& [text, seconds] :
       std::initializer_list<std::pair<const char*, std::int64_t>>{{"1970-01-01T00:00:00Z", 0},
                                                                   {"2026-11-22T20:00:00Z", 1'795'377'600},
                                                                   {"1969-12-31T23:59:59Z", -1},
                                                                   {"2024-02-29T00:00:00Z", 1'709'164'800},
                                                                   {"0000-01-01T00:00:00Z", -62'167'219'200},
                                                                   {"9999-12-31T23:59:59Z", 253'402'300'799}}) {
    EXPECT_EQ(parseDateText(text), (Date{seconds, 0})) << text;
    EXPECT_EQ(dateText({seconds, 5}), text);
  }
  for (const char* text : {"2026-11-22", "2026-11-22T20:00:00", "2026-11-22 20:00:00Z", "2026-13-01T00:00:00Z",
                           "2023-02-29T00:00:00Z", "2026-01-01T24:00:00Z", "2026-01-01T00:00:60Z",
                           "2026-01-00T00:00:00Z", "+026-01-01T00:00:00Z", "2026-01-01T00:00:00Zx"}) {
    EXPECT_EQ(parseDateText(text), std::nullopt) << text;
  }
  EXPECT_EQ(dateText({253'402'300'800, 0}), std::nullopt);
  EXPECT_EQ(describeDate({std::numeric_limits<std::int64_t>::min(), 0}), "<-9223372036854775808 seconds since 1970>");
}

TEST(ValueTextTest, NumericOrderComparesRunsOfDigitsByValue) {
  // Each orders before the next; those of one line are equal.
  const std::vector<std::vector<std::string>> order = {{""},
                                                       {"0", "00"},
                                                       {"0a", "000a"},
                                                       {"1", "01", "0001"},
                                                       {"1."},
                                                       {"1.2", "1.02"},
                                                       {"1.9"},
                                                       {"1.10", "01.010"},
                                                       {"1.10.0"},
                                                       {"1.a"},
                                                       {"18446744073709551616"},
                                                       {"18446744073709551617", "018446744073709551617"},
                                                       {"A10"},
                                                       {"a"},
                                                       {"a0"},
                                                       {"a2b"},
                                                       {"a10b"},
                                                       {"\xC3\xA9"},
                                                       {"\xEF\xBC\x91"},
                                                       {"\xF0\x9F\x98\x80"}};
  for (std::size_t i = 0; i < order.size(); ++i) {
    for (std::size_t j = 0; j < order.size(); ++j) {
      for (const std::string& a : order[i]) {
        for (const std::string& b : order[j]) {
          EXPECT_EQ(compareNumeric(a, b), i <=> j) << a << " and " << b;
          EXPECT_EQ(withoutLeadingZeros(a) == withoutLeadingZeros(b), i == j) << a << " and " << b;
        }
      }
    }
  }
}

TEST(ValueTextTest, XmlTextIsUtf8WithoutWhatXmlLacks) {
  const std::string padding(13, 'x');
  for (const char* good : {"\t\n\r ", "\x7F", "\xC2\x80", "\xED\x9F\xBF", "\xEE\x80\x80", "\xEF\xBF\xBD",
                           "\xF0\x90\x80\x80", "\xF4\x8F\xBF\xBF"}) {
    for (std::size_t at = 0; at <= padding.size(); ++at) {
      EXPECT_TRUE(isXmlText(std::string(padding).insert(at, good))) << good << " at " << at;
    }
  }
  for (const char* bad :
       {"\x01", "\x1F", "\x80", "\xBF", "\xC0\x80", "\xC1\xBF", "\xC3", "\xE0\x9F\xBF", "\xED\xA0\x80", "\xEF\xBF\xBE",
        "\xEF\xBF\xBF", "\xF0\x8F\xBF\xBF", "\xF4\x90\x80\x80", "\xF5\x80\x80\x80", "\xFF", "\xE2\x82"}) {
    for (std::size_t at = 0; at <= padding.size(); ++at) {
      const std::string text = std::string(padding).insert(at, bad);
      EXPECT_EQ(xmlTextLength(text), at) << "0x" << std::hex << int{static_cast<unsigned char>(*bad)};
      EXPECT_TRUE(isXmlText(repairedXmlText(text)));
    }
  }
  EXPECT_EQ(xmlTextLength(std::string_view("ab\0c", 4)), 2U);
  EXPECT_EQ(repairedXmlText("a\x01\xC3z"), "a\xEF\xBF\xBD\xEF\xBF\xBDz");
  EXPECT_TRUE(isUtf8("\x01\xEF\xBF\xBF"));
  EXPECT_FALSE(isUtf8("a\xED\xA0\x80"));
}

}  // namespace
}  // namespace platform
